#include "platform/listen/ExtensionTokens.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <new>
#include <utility>

namespace orvanta::platform {

ExtensionHandle ExtensionHandle::consume(const std::optional<std::string>& token, int descriptor) {
  return ExtensionHandle(token ? descriptor : -1);
}

ExtensionHandle::ExtensionHandle(ExtensionHandle&& other) noexcept
    : _descriptor(std::exchange(other._descriptor, -1)) {}

std::optional<std::uint64_t> ExtensionHandle::regularFileSize() const {
  struct stat attributes {};
  if (!grantsAccess() || ::fstat(_descriptor, &attributes) != 0 || !S_ISREG(attributes.st_mode)) return std::nullopt;
  return static_cast<std::uint64_t>(attributes.st_size);
}

std::optional<std::string> ExtensionHandle::read(std::size_t size) const {
  if (!grantsAccess()) return std::nullopt;
  std::string content;
  try {
    content.resize(size);
  } catch (const std::bad_alloc&) {
    return std::nullopt;
  }
  std::size_t done = 0;
  while (done < size) {
    const ssize_t got = ::pread(_descriptor, content.data() + done, size - done, static_cast<off_t>(done));
    if (got < 0 && errno == EINTR) continue;
    if (got < 0) return std::nullopt;
    if (got == 0) break;
    done += static_cast<std::size_t>(got);
  }
  content.resize(done);
  return content;
}

}  // namespace orvanta::platform
