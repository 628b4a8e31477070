#pragma once

#include <sys/types.h>

#include <cstddef>
#include <ctime>
#include <string>

#include "platform/core/Result.h"

namespace orvanta::platform {

// Tells one state of a file from another without reading it. A plain value.
struct FileStamp {
  bool exists = false;
  // False when the file had changed so shortly before the stamp was taken that one more change, within the granularity
  // of the file system's times, could leave the same stamp: such a stamp proves nothing later.
  bool settled = false;
  dev_t device = 0;
  ino_t inode = 0;
  off_t size = 0;
  timespec modified{};
  timespec changed{};  // of the inode; unlike `modified` it cannot be set back

  static FileStamp of(const std::string& path);
  static FileStamp of(int fd);
  // Returns whether a file that had this stamp, and now has `now`, is certain to have the same content.
  bool stillHolds(const FileStamp& now) const;
};

struct StampedContent {
  FileStamp stamp;  // taken before reading
  std::string bytes;
};

// Reads a whole regular file. A missing file is not a failure: its stamp says so.
Result<StampedContent> readStamped(const std::string& path, std::size_t maximumBytes);

}  // namespace orvanta::platform
