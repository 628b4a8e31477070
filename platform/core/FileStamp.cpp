#include "platform/core/FileStamp.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>

#include <cerrno>
#include <utility>

#include "platform/core/Text.h"
#include "platform/core/UniqueFd.h"
#include "platform/core/WholeFile.h"

namespace orvanta::platform {

namespace {

// The coarsest times among the file systems that a state directory may lie on.
constexpr time_t kGranularitySeconds = 2;

FileStamp stampFrom(const struct stat& status) {
  FileStamp stamp;
  stamp.exists = true;
  stamp.device = status.st_dev;
  stamp.inode = status.st_ino;
  stamp.size = status.st_size;
  stamp.modified = status.st_mtim;
  stamp.changed = status.st_ctim;
  timespec now{};
  ::clock_gettime(CLOCK_REALTIME, &now);
  stamp.settled = now.tv_sec - status.st_ctim.tv_sec > kGranularitySeconds;
  return stamp;
}

bool equal(const timespec& a, const timespec& b) {
  return a.tv_sec == b.tv_sec && a.tv_nsec == b.tv_nsec;
}

Failure failure(const std::string& path, const std::string& reason) {
  return {fmt::format("cannot read {}: {}", path, reason)};
}

}  // namespace

FileStamp FileStamp::of(const std::string& path) {
  struct stat status {};
  if (::stat(path.c_str(), &status) == 0) return stampFrom(status);
  FileStamp stamp;
  stamp.settled = true;
  return stamp;
}

FileStamp FileStamp::of(int fd) {
  struct stat status {};
  return ::fstat(fd, &status) == 0 ? stampFrom(status) : FileStamp{};
}

bool FileStamp::stillHolds(const FileStamp& now) const {
  if (!settled || exists != now.exists) return false;
  return !exists || (device == now.device && inode == now.inode && size == now.size && equal(modified, now.modified) &&
                     equal(changed, now.changed));
}

Result<StampedContent> readStamped(const std::string& path, std::size_t maximumBytes) {
  // Not blocking, so that a FIFO in the file's place cannot hold the caller.
  const UniqueFd fd(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
  StampedContent content;
  if (!fd) {
    const int code = errno;
    if (code != ENOENT && code != ENOTDIR) return failure(path, errnoText(code));
    content.stamp.settled = true;
    return content;
  }
  struct stat status {};
  if (::fstat(fd.get(), &status) != 0) return failure(path, errnoText(errno));
  if (!S_ISREG(status.st_mode)) return failure(path, "not a regular file");
  content.stamp = stampFrom(status);
  auto bytes = readToEnd(fd.get(), maximumBytes);
  if (!bytes) return failure(path, bytes.error());
  content.bytes = std::move(*bytes);
  return content;
}

}  // namespace orvanta::platform
