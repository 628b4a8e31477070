#include "platform/PropertyList.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <system_error>

#include <fmt/format.h>

#include "platform/UniqueFd.h"

namespace platform {

namespace {

constexpr std::string_view kBinaryMagic = "bplist";
constexpr std::size_t kReadChunk = 64U << 10U;

std::string errnoText(int error) {
  return std::generic_category().message(error);
}

Result<std::vector<std::uint8_t>> readFile(const std::string& path, std::size_t maximumBytes) {
  // Non-blocking, so that a FIFO in a file's place does not hold the caller.
  const UniqueFd file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
  struct stat status {};
  if (!file || ::fstat(file.get(), &status) != 0) return Failure{errnoText(errno)};
  if (!S_ISREG(status.st_mode)) return Failure{"no regular file"};

  std::vector<std::uint8_t> bytes;
  std::size_t filled = 0;
  // The size is a hint only: some file systems do not know it, and the file may be growing.
  bytes.resize(std::min(static_cast<std::size_t>(std::max<off_t>(status.st_size, 0)), maximumBytes) + 1);
  for (;;) {
    if (filled == bytes.size()) bytes.resize(filled + kReadChunk);
    const ssize_t count = ::read(file.get(), bytes.data() + filled, bytes.size() - filled);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return Failure{errnoText(errno)};
    if (count == 0) break;
    filled += static_cast<std::size_t>(count);
    if (filled > maximumBytes) return Failure{fmt::format("more than {} bytes", maximumBytes)};
  }
  bytes.resize(filled);
  return bytes;
}

}  // namespace

Result<Value> parsePropertyList(std::span<const std::uint8_t> bytes, const PropertyListLimits& limits) {
  if (bytes.empty()) return Failure{"an empty property list"};
  const std::string_view text(reinterpret_cast<const char*>(bytes.data()), bytes.size());
  return text.starts_with(kBinaryMagic) ? parseBinaryPropertyList(bytes, limits) : parseXmlPropertyList(bytes, limits);
}

Result<Value> readPropertyListFile(const std::string& path, const PropertyListLimits& limits) {
  const Result<std::vector<std::uint8_t>> bytes = readFile(path, limits.maximumBytes);
  if (!bytes) return Failure{fmt::format("{}: {}", path, bytes.error())};
  Result<Value> value = parsePropertyList(*bytes, limits);
  if (!value) return Failure{fmt::format("{}: {}", path, value.error())};
  return value;
}

}  // namespace platform
