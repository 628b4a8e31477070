#include "platform/codec/PropertyList.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>

#include <fmt/format.h>

#include "platform/core/Text.h"
#include "platform/core/UniqueFd.h"
#include "platform/core/WholeFile.h"

namespace orvanta::platform {

namespace {

constexpr std::string_view kBinaryMagic = "bplist";

Result<std::string> readFile(const std::string& path, std::size_t maximumBytes) {
  // Non-blocking, so that a FIFO in a file's place does not hold the caller.
  const UniqueFd file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
  struct stat status {};
  if (!file || ::fstat(file.get(), &status) != 0) return Failure{errnoText(errno)};
  if (!S_ISREG(status.st_mode)) return Failure{"no regular file"};
  return readToEnd(file.get(), maximumBytes);
}

}  // namespace

Result<Value> parsePropertyList(std::span<const std::uint8_t> bytes, const PropertyListLimits& limits) {
  if (bytes.empty()) return Failure{"an empty property list"};
  const std::string_view text(reinterpret_cast<const char*>(bytes.data()), bytes.size());
  return text.starts_with(kBinaryMagic) ? parseBinaryPropertyList(bytes, limits) : parseXmlPropertyList(bytes, limits);
}

Result<Value> readPropertyListFile(const std::string& path, const PropertyListLimits& limits) {
  const Result<std::string> bytes = readFile(path, limits.maximumBytes);
  if (!bytes) return Failure{fmt::format("{}: {}", path, bytes.error())};
  Result<Value> value =
      parsePropertyList({reinterpret_cast<const std::uint8_t*>(bytes->data()), bytes->size()}, limits);
  if (!value) return Failure{fmt::format("{}: {}", path, value.error())};
  return value;
}

}  // namespace orvanta::platform
