#include "platform/host/JsonLinesPowerLog.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <utility>

#include "platform/codec/Json.h"
#include "platform/core/Log.h"
#include "platform/core/Text.h"

namespace orvanta::platform {

namespace {

constexpr mode_t kFileMode = 0640;

std::string formatLine(std::int32_t event, std::string_view sender, double time, const Dictionary& record) {
  std::string line = R"({"event":)";
  appendJsonNumber(line, std::int64_t{event});
  line += R"(,"sender":)";
  appendJsonString(line, sender);
  line += R"(,"time":)";
  if (!appendJsonNumber(line, time)) line += "null";
  line += R"(,"record":{)";
  bool first = true;
  for (const auto& [key, value] : record) {
    if (!first) line += ',';
    first = false;
    appendJsonString(line, key);
    line += ':';
    line += writeJson(value);
  }
  line += "}}\n";
  return line;
}

}  // namespace

JsonLinesPowerLog::JsonLinesPowerLog(std::string path, const Clock& clock, std::size_t generationBytes)
    : _clock(clock), _path(std::move(path)), _olderPath(_path + ".1"), _generationBytes(generationBytes) {}

void JsonLinesPowerLog::registeredEvent(std::int32_t event, std::string_view sender, const Dictionary& record) {
  const std::string line = formatLine(event, sender, _clock.wallSeconds(), record);
  const MutexLock lock(_mutex);
  const bool written = append(line);
  if (!written && !_failing) {
    PLATFORM_LOG(warning, "registeredEvent: cannot write to {}: {}", _path, errnoText(errno));
  }
  _failing = !written;
}

bool JsonLinesPowerLog::openFile() {
  struct stat status {};
  // Lines in a file that has been removed, renamed or replaced would never be read.
  if (_file && ::lstat(_path.c_str(), &status) == 0 && status.st_dev == _device && status.st_ino == _inode) return true;
  _file.reset(::open(_path.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, kFileMode));
  if (!_file || ::fstat(_file.get(), &status) != 0) return false;
  if (!S_ISREG(status.st_mode)) {
    _file.reset();
    errno = EINVAL;
    return false;
  }
  _device = status.st_dev;
  _inode = status.st_ino;
  _size = static_cast<std::size_t>(status.st_size);
  return true;
}

bool JsonLinesPowerLog::append(std::string_view line) {
  if (line.size() > _generationBytes) {
    errno = EFBIG;
    return false;
  }
  if (!openFile()) return false;
  if (_size > 0 && _size + line.size() > _generationBytes) {
    if (std::rename(_path.c_str(), _olderPath.c_str()) != 0) return false;
    _file.reset();
    if (!openFile()) return false;
  }
  const ssize_t written = ::write(_file.get(), line.data(), line.size());
  if (written == static_cast<ssize_t>(line.size())) {
    _size += line.size();
    return true;
  }
  // Half a line would spoil the next one. A part that cannot be cut off is counted when the file is opened again.
  if (written >= 0) {
    if (::ftruncate(_file.get(), static_cast<off_t>(_size)) != 0) _file.reset();
    errno = ENOSPC;
  }
  return false;
}

}  // namespace orvanta::platform
