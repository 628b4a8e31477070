#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "platform/core/FileStamp.h"
#include "platform/core/Mutex.h"
#include "platform/core/Result.h"
#include "platform/core/Value.h"

namespace orvanta::platform {

// One domain of user defaults: an XML property list `directory`/`domain`.plist, shared with other processes.
//
// Reading re-reads the file when its inode, size or time has changed. Writing takes a lock on the directory, re-reads,
// changes one key and replaces the file (temporary file, fsync, rename, fsync of the directory), so that it is whole at
// every moment. A file that does not parse is kept aside as `domain`.plist.corrupt, logged, and counts as empty; one
// that cannot be read is logged, counts as empty and is never written over. Thread-safe.
class UserDefaults {
 public:
  UserDefaults(std::string directory, std::string domain);

  // A copy of the value; nullopt when absent or when the file cannot be read (logged).
  std::optional<Value> value(std::string_view key);
  // A text as it is, a number as its decimal text, anything else as its description; nullopt when absent.
  std::optional<std::string> text(std::string_view key);
  Dictionary all();
  // Null erases the key. Returns whether the file had to change. A failure says why; the file is then unchanged.
  Result<bool> set(std::string_view key, Value value);
  // The value under `key`, or the one that `make` gives after storing it: read and write are one step across processes.
  // The new value comes back even when it could not be stored (logged).
  template <class Make>
  Value valueOrStore(std::string_view key, Make make) {
    if (auto present = value(key)) return std::move(*present);
    return storeIfAbsent(key, make());
  }

  const std::string& path() const { return _path; }

 private:
  class DirectoryLock;

  Value storeIfAbsent(std::string_view key, Value fresh);
  const Dictionary& current() REQUIRES(_mutex);
  Result<void> load(const DirectoryLock* lock) REQUIRES(_mutex);
  Result<void> keepAside(const FileStamp& stamp, const std::string& why) REQUIRES(_mutex);
  Result<void> leaveInPlace(const FileStamp& stamp, const std::string& why, const std::string& obstacle)
      REQUIRES(_mutex);
  Result<bool> change(const DirectoryLock& lock, std::string_view key, Value value) REQUIRES(_mutex);
  Result<void> replaceFile(const DirectoryLock& lock, const Dictionary& content) REQUIRES(_mutex);
  void logOnce(const std::string& problem) REQUIRES(_mutex);

  // Constant after construction.
  const std::string _directory;
  const std::string _fileName;
  const std::string _path;

  Mutex _mutex;
  Dictionary _cached GUARDED_BY(_mutex);
  FileStamp _stamp GUARDED_BY(_mutex);  // of the file that _cached came from
  bool _loaded GUARDED_BY(_mutex) = false;
  std::string _problem GUARDED_BY(_mutex);  // the last one logged, until the file reads well again
};

}  // namespace orvanta::platform
