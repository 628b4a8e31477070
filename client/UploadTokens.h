#pragma once

#include <sys/types.h>

#include <condition_variable>
#include <cstddef>
#include <map>
#include <mutex>
#include <optional>
#include <string>

#include "interface/Reply.h"
#include "interface/WireLimits.h"
#include "platform/core/UniqueFd.h"

namespace orvanta {

// The files that are being uploaded over one connection: opens them for the daemon, remembers under which token, and
// removes one when the daemon asks for it and the path still leads to the very file that was opened.
//
// Owned by the connection's channel. Thread-safe.
class UploadTokens {
 public:
  // More descriptors than this may not wait at the daemon, or it ends the connection.
  static constexpr std::size_t kMaximumInFlight = kMaximumWaitingDescriptors;

  struct Opened {
    std::string path;  // absolute
    std::string token;
    platform::UniqueFd descriptor;  // for the daemon, which reads the file through it alone
  };
  // Opens the file for reading; of anything but a regular file the descriptor only says what it is, so that nothing is
  // woken or read by opening it (a FIFO, a device). Never waits for the file. A token is made up when none is given.
  // While kMaximumInFlight files are being uploaded: waits for one to end if `wait`, else fails. The entry stays until
  // forget().
  CallResult<Opened> open(const std::string& path, std::optional<std::string> token, bool wait);
  // The upload has ended, whatever came of it.
  void forget(const std::string& token);
  // Removes the token's file. Does nothing for an unknown token, or when the path leads to another file by now; a file
  // that cannot be removed stays. Of a symbolic link the file behind it goes, and the link stays.
  void removeFile(const std::string& token);
  // The connection has ended: forgets all tokens, wakes those who wait and fails whatever is opened from now on.
  void close(const CallError& reason);

  std::size_t inFlight() const;

 private:
  struct Entry {
    std::string path;
    // Held open so that no other file can get the same inode number in the meantime.
    platform::UniqueFd file;
  };

  mutable std::mutex _mutex;
  std::condition_variable _ended;
  std::map<std::string, Entry, std::less<>> _entries;  // guarded by _mutex
  std::optional<CallError> _closed;                    // guarded by _mutex
};

}  // namespace orvanta
