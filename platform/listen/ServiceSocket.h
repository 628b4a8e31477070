#pragma once

#include <sys/types.h>

#include <string>

#include "platform/core/Result.h"
#include "platform/core/UniqueFd.h"

namespace orvanta::platform {

// A listening Unix stream socket, non-blocking, and what it left in the file system. Owned by the listener.
struct ServiceSocket {
  UniqueFd socket;
  // Of a socket that we bound; for one that was passed to us all of these are empty.
  std::string path;
  UniqueFd lock;  // held for as long as we own the name
  dev_t device = 0;
  ino_t inode = 0;

  // Removes the socket file if it is still ours, and gives up the name.
  void removeFile();
};

// The socket that the service manager passed, if it did, else a new one bound at `directory`/`service`, to which every
// user may connect. Fails when another process listens there, and names it. Of two processes that try at once one
// fails: the name belongs to the process that holds the lock on `service`.lock beside it; the lock goes with its
// process, its file stays. A socket file without a listener is replaced.
Result<ServiceSocket> openServiceSocket(const std::string& directory, const std::string& service);

}  // namespace orvanta::platform
