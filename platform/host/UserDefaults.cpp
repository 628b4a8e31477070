#include "platform/host/UserDefaults.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <system_error>

#include "platform/codec/PropertyList.h"
#include "platform/core/Log.h"
#include "platform/core/Text.h"
#include "platform/core/UniqueFd.h"
#include "platform/queue/WorkQueue.h"

namespace orvanta::platform {

namespace {

constexpr std::size_t kMaximumBytes = 16U << 20U;
constexpr mode_t kNewFileMode = 0600;  // persistent identifiers are for this account alone

// Waits for the mutex in a BlockingScope: the thread that holds it may be waiting for a disk or another process.
class SCOPED_CAPABILITY BlockingLock {
 public:
  explicit BlockingLock(Mutex& mutex) ACQUIRE(mutex) : _mutex(mutex) {
    if (mutex.try_lock()) return;
    const BlockingScope blocking;
    mutex.lock();
  }
  ~BlockingLock() RELEASE() { _mutex.unlock(); }
  BlockingLock(const BlockingLock&) = delete;
  BlockingLock& operator=(const BlockingLock&) = delete;

 private:
  Mutex& _mutex;
};

bool writeAll(int fd, std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t count = ::write(fd, bytes.data(), bytes.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return false;
    bytes.remove_prefix(static_cast<std::size_t>(count));
  }
  return true;
}

}  // namespace

// Keeps other writers out, those of other processes too, while it lives. The lock sits on the directory itself, which
// stays while the files in it are replaced.
class UserDefaults::DirectoryLock {
 public:
  static Result<DirectoryLock> take(const std::string& directory) {
    std::error_code ignored;
    std::filesystem::create_directories(directory, ignored);  // a failure shows when the directory is opened
    UniqueFd fd(::open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!fd) return Failure{fmt::format("cannot open {}: {}", directory, errnoText(errno))};
    while (::flock(fd.get(), LOCK_EX) != 0) {
      if (errno != EINTR) return Failure{fmt::format("cannot lock {}: {}", directory, errnoText(errno))};
    }
    return DirectoryLock(std::move(fd));
  }
  int directory() const { return _fd.get(); }

 private:
  explicit DirectoryLock(UniqueFd fd) : _fd(std::move(fd)) {}
  UniqueFd _fd;  // closing it gives the lock back
};

UserDefaults::UserDefaults(std::string directory, std::string domain)
    : _directory(std::move(directory)), _fileName(std::move(domain) + ".plist"), _path(_directory + "/" + _fileName) {}

std::optional<Value> UserDefaults::value(std::string_view key) {
  const BlockingLock locked(_mutex);
  const Value* found = current().find(key);
  if (found == nullptr) return std::nullopt;
  return *found;
}

std::optional<std::string> UserDefaults::text(std::string_view key) {
  const BlockingLock locked(_mutex);
  const Value* found = current().find(key);
  if (found == nullptr) return std::nullopt;
  if (const std::string* text = found->string()) return *text;
  return found->description();
}

Dictionary UserDefaults::all() {
  const BlockingLock locked(_mutex);
  return current();
}

Result<bool> UserDefaults::set(std::string_view key, Value value) {
  const BlockingScope blocking;
  const BlockingLock locked(_mutex);
  const auto lock = DirectoryLock::take(_directory);
  if (!lock) return Failure{lock.error()};
  if (const auto loaded = load(&*lock); !loaded) return Failure{loaded.error()};
  return change(*lock, key, std::move(value));
}

Value UserDefaults::storeIfAbsent(std::string_view key, Value fresh) {
  const BlockingScope blocking;
  const BlockingLock locked(_mutex);
  std::string problem;
  if (const auto lock = DirectoryLock::take(_directory); !lock) {
    problem = lock.error();
  } else if (const auto loaded = load(&*lock); !loaded) {
    problem = loaded.error();
  } else if (const Value* present = _cached.find(key)) {
    return *present;
  } else if (const auto stored = change(*lock, key, fresh); !stored) {
    problem = stored.error();
  }
  if (!problem.empty()) PLATFORM_LOG(error, "UserDefaults: the new value of {} is not kept: {}", key, problem);
  return fresh;
}

const Dictionary& UserDefaults::current() {
  if (!_loaded || !_stamp.stillHolds(FileStamp::of(_path))) static_cast<void>(load(nullptr));  // logs its failure
  return _cached;
}

// Reads the file anew. A failure, which is logged, means that there is a file but that its content is not known; it
// then counts as empty.
Result<void> UserDefaults::load(const DirectoryLock* lock) {
  _loaded = false;
  _cached = Dictionary();
  auto content = readStamped(_path, kMaximumBytes);
  if (!content) {
    logOnce(content.error());
    return Failure{content.error()};
  }
  if (content->stamp.exists) {
    const auto* bytes = reinterpret_cast<const std::uint8_t*>(content->bytes.data());
    auto parsed = parsePropertyList({bytes, content->bytes.size()});
    if (!parsed || parsed->dictionary() == nullptr) {
      const std::string why = parsed ? "it is not a dictionary" : parsed.error();
      if (lock != nullptr) return keepAside(content->stamp, why);
      // Moving it is a change as well: under the lock, after looking again, since a writer may have repaired it.
      const BlockingScope blocking;
      const auto taken = DirectoryLock::take(_directory);
      return taken ? load(&*taken) : leaveInPlace(content->stamp, why, taken.error());
    }
    _cached = std::move(*parsed->dictionary());
  }
  _stamp = content->stamp;
  _loaded = true;
  _problem.clear();
  return {};
}

Result<void> UserDefaults::keepAside(const FileStamp& stamp, const std::string& why) {
  const std::string aside = _path + ".corrupt";
  if (std::rename(_path.c_str(), aside.c_str()) != 0) return leaveInPlace(stamp, why, errnoText(errno));
  PLATFORM_LOG(error, "UserDefaults: {} is no property list, kept aside as {}: {}", _path, aside, why);
  _stamp = FileStamp::of(_path);
  _loaded = true;
  _problem.clear();
  return {};
}

// Remembers a file that is invalid and cannot be moved, so that it is not read and logged again at every question.
Result<void> UserDefaults::leaveInPlace(const FileStamp& stamp, const std::string& why, const std::string& obstacle) {
  _stamp = stamp;
  _loaded = true;
  const auto problem = fmt::format("{} is no property list ({}) and cannot be kept aside: {}", _path, why, obstacle);
  logOnce(problem);
  return Failure{problem};
}

Result<bool> UserDefaults::change(const DirectoryLock& lock, std::string_view key, Value value) {
  const Value* present = _cached.find(key);
  if (value.isNull() ? present == nullptr : present != nullptr && *present == value) return false;
  Dictionary next = _cached;
  if (value.isNull()) {
    next.erase(key);
  } else {
    next.set(key, std::move(value));
  }
  if (const auto replaced = replaceFile(lock, next); !replaced) return Failure{replaced.error()};
  _cached = std::move(next);
  _stamp = FileStamp::of(_path);
  return true;
}

Result<void> UserDefaults::replaceFile(const DirectoryLock& lock, const Dictionary& content) {
  const auto text = writeXmlPropertyList(Value(content));
  if (!text) return Failure{text.error()};
  const int directory = lock.directory();
  // One name suffices, as writers take turns; a file left by a killed one is not in use.
  const std::string temporary = _fileName + ".new";
  ::unlinkat(directory, temporary.c_str(), 0);
  const UniqueFd fd(::openat(directory, temporary.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, kNewFileMode));
  if (!fd) return Failure{fmt::format("cannot make {}.new: {}", _path, errnoText(errno))};
  struct stat before {};
  const bool replaces = ::fstatat(directory, _fileName.c_str(), &before, 0) == 0;
  // A file that another account may read stays readable for it when an administrator's program writes; a first file
  // of root's belongs to the account that the directory belongs to.
  const bool takesOwner = replaces || (::geteuid() == 0 && ::fstat(directory, &before) == 0);
  if (takesOwner && before.st_uid != ::geteuid() && ::fchown(fd.get(), before.st_uid, before.st_gid) != 0) {
    PLATFORM_LOG(warning, "UserDefaults: {} changes its owner: {}", _path, errnoText(errno));
  }
  if ((replaces && ::fchmod(fd.get(), before.st_mode & 07777U) != 0) || !writeAll(fd.get(), *text) ||
      ::fsync(fd.get()) != 0 || ::renameat(directory, temporary.c_str(), directory, _fileName.c_str()) != 0) {
    const int code = errno;
    ::unlinkat(directory, temporary.c_str(), 0);
    return Failure{fmt::format("cannot write {}: {}", _path, errnoText(code))};
  }
  if (::fsync(directory) != 0) PLATFORM_LOG(warning, "UserDefaults: cannot sync {}: {}", _directory, errnoText(errno));
  return {};
}

void UserDefaults::logOnce(const std::string& problem) {
  if (problem == _problem) return;
  _problem = problem;
  PLATFORM_LOG(error, "UserDefaults: {}", problem);
}

}  // namespace orvanta::platform
