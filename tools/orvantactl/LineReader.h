#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "interface/WireLimits.h"

namespace orvanta::ctl {

// Lines from a descriptor, each as soon as it has arrived. Keeps at most one line of kMaximumLine bytes. Used by one
// thread.
class LineReader {
 public:
  // No event that the daemon takes is larger.
  static constexpr std::size_t kMaximumLine = kMaximumFrameBytes;

  explicit LineReader(int fd) : _fd(fd) {}

  enum class Outcome { line, tooLong, end, failed };
  // The next line without its end; valid until the next call. A line that is too long is skipped.
  Outcome next(std::string_view& line);

  std::uint64_t lineNumber() const { return _lineNumber; }  // of the last line returned, from 1
  std::uint64_t bytesRead() const { return _bytesRead; }
  int error() const { return _error; }  // errno, after `failed`

 private:
  bool fill();  // false at the end and on failure

  const int _fd;
  std::string _buffer;
  std::size_t _start = 0;     // of the next line
  std::size_t _searched = 0;  // no line end before this
  std::uint64_t _lineNumber = 0;
  std::uint64_t _bytesRead = 0;
  bool _ended = false;
  int _error = 0;
};

}  // namespace orvanta::ctl
