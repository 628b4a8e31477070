#include "client/UploadTokens.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <filesystem>
#include <system_error>
#include <utility>

#include "platform/core/Text.h"

namespace orvanta {

using platform::MutexLock;
using platform::UniqueFd;

namespace {

CallError notReadable(const std::string& path, int error) {
  return {fmt::format("cannot open {}: {}", path, platform::errnoText(error)), CallErrorKind::fileNotReadable};
}

// 128 random bits as hexadecimal digits; nullopt when the system does not give any.
std::optional<std::string> makeToken() {
  std::array<char, 16> bytes{};
  if (::getrandom(bytes.data(), bytes.size(), 0) != static_cast<ssize_t>(bytes.size())) return std::nullopt;
  return platform::hexText(std::string_view(bytes.data(), bytes.size()));
}

// Anything but a regular file is only referred to, not opened, since the daemon refuses it by its type alone: opening a
// FIFO would wake its writer and lose the data in it, and some devices act when they are opened.
UniqueFd openForDaemon(const std::string& path) {
  UniqueFd reference(::open(path.c_str(), O_PATH | O_CLOEXEC));
  struct stat attributes {};
  if (!reference || ::fstat(reference.get(), &attributes) != 0) return {};
  if (!S_ISREG(attributes.st_mode)) return reference;
  return UniqueFd(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
}

bool sameFile(const struct stat& a, const struct stat& b) {
  return a.st_dev == b.st_dev && a.st_ino == b.st_ino;
}

// The directory is held open between the comparison and the removal, so that only the last name could still be swapped.
void removeIfSame(const std::string& path, const struct stat& opened) {
  std::array<char, PATH_MAX> resolved{};
  if (::realpath(path.c_str(), resolved.data()) == nullptr) return;
  const std::filesystem::path target(resolved.data());
  const UniqueFd directory(::open(target.parent_path().c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  struct stat now {};
  if (!directory || ::fstatat(directory.get(), target.filename().c_str(), &now, AT_SYMLINK_NOFOLLOW) != 0) return;
  if (S_ISREG(now.st_mode) && sameFile(now, opened)) ::unlinkat(directory.get(), target.filename().c_str(), 0);
}

}  // namespace

CallResult<UploadTokens::Opened> UploadTokens::open(const std::string& path, std::optional<std::string> token,
                                                    bool wait) {
  std::error_code failure;
  const std::string absolute = std::filesystem::absolute(path, failure).string();
  if (failure) return notReadable(path, failure.value());
  UniqueFd file = openForDaemon(absolute);
  if (!file) return notReadable(absolute, errno);
  UniqueFd kept(::fcntl(file.get(), F_DUPFD_CLOEXEC, 0));
  if (!kept) return notReadable(absolute, errno);
  if (!token) token = makeToken();
  if (!token) return CallError{"no random bytes for an upload token", CallErrorKind::fileNotReadable};

  MutexLock lock(_mutex);
  while (wait && !_closed && _entries.size() >= kMaximumInFlight) _ended.wait(lock);
  if (_closed) return *_closed;
  if (_entries.size() >= kMaximumInFlight) {
    return CallError{fmt::format("{} files are being uploaded, and no more may wait: go on when one has been answered",
                                 kMaximumInFlight),
                     CallErrorKind::tooMuchWaiting};
  }
  const auto [entry, fresh] = _entries.try_emplace(*token);
  if (!fresh) return CallError{"the upload token is in use already", CallErrorKind::refused};
  entry->second = {absolute, std::move(kept)};
  return Opened{absolute, std::move(*token), std::move(file)};
}

void UploadTokens::forget(const std::string& token) {
  const MutexLock lock(_mutex);
  _entries.erase(token);
  _ended.notifyAll();
}

void UploadTokens::removeFile(const std::string& token) {
  std::string path;
  struct stat opened {};
  {
    const MutexLock lock(_mutex);
    const auto found = _entries.find(token);
    if (found == _entries.end() || ::fstat(found->second.file.get(), &opened) != 0) return;
    path = found->second.path;
  }
  removeIfSame(path, opened);
}

void UploadTokens::close(const CallError& reason) {
  const MutexLock lock(_mutex);
  _closed = reason;
  _entries.clear();
  _ended.notifyAll();
}

std::size_t UploadTokens::inFlight() const {
  const MutexLock lock(_mutex);
  return _entries.size();
}

}  // namespace orvanta
