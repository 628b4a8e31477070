#include "tools/orvantactl/LineReader.h"

#include <unistd.h>

#include <cerrno>

namespace orvanta::ctl {

namespace {
constexpr std::size_t kReadSize = 64U << 10U;
}

LineReader::Outcome LineReader::next(std::string_view& line) {
  bool tooLong = false;
  for (;;) {
    const auto end = _buffer.find('\n', _searched);
    if (end != std::string::npos) {
      line = std::string_view(_buffer).substr(_start, end - _start);
      if (line.ends_with('\r')) line.remove_suffix(1);
      _start = _searched = end + 1;
      ++_lineNumber;
      return tooLong || line.size() > kMaximumLine ? Outcome::tooLong : Outcome::line;
    }
    if (_buffer.size() - _start > kMaximumLine) {
      tooLong = true;
      _buffer.clear();
      _start = 0;
    }
    _searched = _buffer.size();
    if (fill()) continue;
    if (_error != 0) return Outcome::failed;
    if (_start == _buffer.size() && !tooLong) return Outcome::end;
    // The last line may lack its end.
    _buffer += '\n';
  }
}

bool LineReader::fill() {
  if (_ended) return false;
  _buffer.erase(0, _start);
  _searched -= _start;
  _start = 0;
  const auto size = _buffer.size();
  _buffer.resize(size + kReadSize);
  ssize_t count = 0;
  do {
    count = ::read(_fd, _buffer.data() + size, kReadSize);
  } while (count < 0 && errno == EINTR);
  _buffer.resize(size + (count > 0 ? static_cast<std::size_t>(count) : 0));
  if (count > 0) {
    _bytesRead += static_cast<std::uint64_t>(count);
    return true;
  }
  _ended = true;
  if (count < 0) _error = errno;
  return false;
}

}  // namespace orvanta::ctl
