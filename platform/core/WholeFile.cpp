#include "platform/core/WholeFile.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

#include "platform/core/Text.h"
#include "platform/core/UniqueFd.h"

namespace orvanta::platform {

namespace {

constexpr std::size_t kReadChunk = 64U << 10U;

}  // namespace

Result<std::string> readToEnd(int fd, std::size_t maximumBytes) {
  struct stat status {};
  if (::fstat(fd, &status) != 0) return Failure{errnoText(errno)};
  std::string bytes;
  std::size_t filled = 0;
  // The size is a hint only: some file systems do not know it, and the file may be growing.
  bytes.resize(std::min(static_cast<std::size_t>(std::max<off_t>(status.st_size, 0)), maximumBytes) + 1);
  for (;;) {
    if (filled == bytes.size()) bytes.resize(filled + kReadChunk);
    const ssize_t count = ::read(fd, bytes.data() + filled, bytes.size() - filled);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return Failure{errnoText(errno)};
    if (count == 0) break;
    filled += static_cast<std::size_t>(count);
    if (filled > maximumBytes) return Failure{fmt::format("more than {} bytes", maximumBytes)};
  }
  bytes.resize(filled);
  return bytes;
}

Result<std::string> readWholeFile(const std::string& path, std::size_t maximumBytes) {
  const UniqueFd file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY));
  if (!file) return Failure{fmt::format("cannot read {}: {}", path, errnoText(errno))};
  auto content = readToEnd(file.get(), maximumBytes);
  if (!content) return Failure{fmt::format("cannot read {}: {}", path, content.error())};
  return content;
}

}  // namespace orvanta::platform
