#include "config/MessageLogDirectory.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <system_error>
#include <utility>

namespace orvanta {

namespace {

constexpr std::string_view kFirstPiece = "orvantad";
constexpr std::string_view kLastPiece = "messageLog.diag";
constexpr mode_t kFileMode = 0640;
constexpr std::size_t kListingBytes = 4096;  // holds the names of a directory that is as it should be

std::optional<double> birthTimeOf(const struct statx& status) {
  if ((status.stx_mask & STATX_BTIME) == 0) return std::nullopt;
  return static_cast<double>(status.stx_btime.tv_sec) + status.stx_btime.tv_nsec / 1e9;
}

}  // namespace

bool isMessageLogName(std::string_view name) {
  const std::size_t first = name.find('_');
  const std::size_t last = name.rfind('_');
  if (first == std::string_view::npos || first == last) return false;
  return name.substr(0, first) == kFirstPiece && name.substr(last + 1) == kLastPiece &&
         name.find('_', first + 1) == last;
}

std::string messageLogName(std::int32_t creationTime) {
  return std::string(kFirstPiece) + "_" + std::to_string(creationTime) + "_" + std::string(kLastPiece);
}

MessageLogDirectory::MessageLogDirectory(std::string path) : _path(std::move(path)) {
  open();
}

void MessageLogDirectory::open() {
  _directory.reset(::open(_path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  _listingError = _directory ? 0 : errno;
  // Enough to work in a directory that may not be listed.
  if (!_directory && _listingError != ENOENT) _directory.reset(::open(_path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
}

int MessageLogDirectory::list(std::vector<Entry>& entries) const {
  if (_listingError != 0) return _listingError;
  alignas(dirent64) char buffer[kListingBytes];
  while (true) {
    const ssize_t count = ::getdents64(_directory.get(), buffer, sizeof buffer);
    if (count == 0) return 0;
    if (count < 0) {
      entries.clear();
      return errno;
    }
    for (ssize_t offset = 0; offset < count;) {
      const auto* entry = reinterpret_cast<const dirent64*>(buffer + offset);
      offset += entry->d_reclen;
      if (!isMessageLogName(entry->d_name)) continue;
      struct statx status {};
      if (::statx(_directory.get(), entry->d_name, AT_SYMLINK_NOFOLLOW, STATX_TYPE | STATX_BTIME, &status) != 0) {
        if (errno != ENOENT) entries.push_back({entry->d_name, std::nullopt});
      } else if (S_ISREG(status.stx_mode)) {
        entries.push_back({entry->d_name, birthTimeOf(status)});
      }
    }
  }
}

void MessageLogDirectory::create() {
  std::error_code ignored;
  std::filesystem::create_directories(_path, ignored);
  open();
}

platform::UniqueFd MessageLogDirectory::openExisting(const std::string& name) const {
  return platform::UniqueFd(
      ::openat(_directory.get(), name.c_str(), O_WRONLY | O_APPEND | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
}

platform::UniqueFd MessageLogDirectory::openNew(const std::string& name) const {
  // A file that another thread made in the same second is as good as one of our own.
  return platform::UniqueFd(::openat(_directory.get(), name.c_str(),
                                     O_WRONLY | O_APPEND | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, kFileMode));
}

MessageLogDirectory::CreationDate MessageLogDirectory::creationDate(const platform::UniqueFd& file) const {
  struct statx status {};
  if (::statx(file.get(), "", AT_EMPTY_PATH, STATX_BTIME, &status) != 0) return std::nullopt;
  return birthTimeOf(status);
}

void MessageLogDirectory::remove(const std::string& name) const {
  ::unlinkat(_directory.get(), name.c_str(), 0);
}

}  // namespace orvanta
