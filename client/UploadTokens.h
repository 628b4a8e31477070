#pragma once

#include <sys/types.h>

#include <cstddef>
#include <map>
#include <optional>
#include <string>

#include "interface/Reply.h"
#include "interface/WireLimits.h"
#include "platform/core/Mutex.h"
#include "platform/core/UniqueFd.h"

namespace orvanta {

// The files that are being uploaded over one connection: opens them for the daemon, remembers under which token, and
// removes one when the daemon asks for it and the path still leads to the very file that was opened.
//
// Owned by the connection's channel. Thread-safe.
class UploadTokens {
 public:
  // With more descriptors waiting the daemon would end the connection.
  static constexpr std::size_t kMaximumInFlight = kMaximumWaitingDescriptors;

  struct Opened {
    std::string path;  // absolute
    std::string token;
    platform::UniqueFd descriptor;  // for the daemon, which reads the file through it alone
  };
  // Opens the file for reading; for anything but a regular file the descriptor only says what it is, so that opening it
  // wakes and reads nothing (a FIFO, a device). Never waits for the file. Makes up a token if not given one. While
  // kMaximumInFlight files are being uploaded: waits for one to end if `wait`, else fails. The entry stays until
  // forget().
  CallResult<Opened> open(const std::string& path, std::optional<std::string> token, bool wait);
  // The upload has ended, well or not.
  void forget(const std::string& token);
  // Removes the token's file. Does nothing for an unknown token, or when the path leads to another file by now; a file
  // that cannot be removed stays. For a symbolic link the file behind it is removed, and the link stays.
  void removeFile(const std::string& token);
  // The connection has ended: forgets all tokens, wakes the callers that wait in open(), and fails later ones.
  void close(const CallError& reason);

  std::size_t inFlight() const;

 private:
  struct Entry {
    std::string path;
    // Held open so that no other file can get the same inode number in the meantime.
    platform::UniqueFd file;
  };

  mutable platform::Mutex _mutex;
  platform::Condition _ended;  // an upload has, or the connection
  std::map<std::string, Entry, std::less<>> _entries GUARDED_BY(_mutex);
  std::optional<CallError> _closed GUARDED_BY(_mutex);  // why no upload is taken any more
};

}  // namespace orvanta
