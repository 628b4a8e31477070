#include "tools/collector/wire/MessageReader.h"

#include <fmt/format.h>
#include <zlib.h>

#include <algorithm>
#include <array>
#include <limits>
#include <utility>

#include "tools/collector/wire/HttpMessage.h"

namespace orvanta::collector {

namespace {

constexpr std::string_view kHeadEnd = "\r\n\r\n";
constexpr std::size_t kMaximumLineBytes = 1024;

class InflateStream {
 public:
  // 32 + 15 detects the gzip or zlib header.
  InflateStream() : _ready(inflateInit2(&_stream, 32 + 15) == Z_OK) {}
  ~InflateStream() {
    if (_ready) inflateEnd(&_stream);
  }
  InflateStream(const InflateStream&) = delete;
  InflateStream& operator=(const InflateStream&) = delete;
  bool ready() const { return _ready; }
  z_stream& operator*() { return _stream; }

 private:
  z_stream _stream{};
  bool _ready;
};

}  // namespace

bool MessageReader::fill() {
  std::array<char, 16384> piece{};
  const std::size_t count = _stream.read(piece.data(), piece.size());
  _buffer.append(piece.data(), count);
  return count > 0;
}

Result<std::optional<std::string>> MessageReader::readHead() {
  std::size_t searched = 0;
  while (true) {
    const auto end = _buffer.find(kHeadEnd, searched - std::min(searched, kHeadEnd.size()));
    if (end != std::string::npos) {
      std::optional<std::string> head(_buffer.substr(0, end + kHeadEnd.size()));
      _buffer.erase(0, head->size());
      return head;
    }
    searched = _buffer.size();
    if (searched > kMaximumHeadBytes) return Failure{kHeadTooLong};
    if (!fill()) {
      if (_buffer.empty()) return std::optional<std::string>();
      return Failure{"the stream ended inside a head"};
    }
  }
}

Result<std::string> MessageReader::readBody(std::size_t length) {
  std::string body = _buffer.substr(0, length);
  _buffer.erase(0, body.size());
  while (body.size() < length) {
    if (!fill()) return Failure{fmt::format("the stream ended after {} of {} bytes of body", body.size(), length)};
    const std::size_t count = std::min(length - body.size(), _buffer.size());
    body.append(_buffer, 0, count);
    _buffer.erase(0, count);
  }
  return body;
}

void MessageReader::discard(std::size_t maximumBytes) {
  std::size_t total = 0;
  do {
    total += _buffer.size();
    _buffer.clear();
  } while (total <= maximumBytes && fill());
}

Result<std::string> MessageReader::readLine() {
  while (true) {
    const auto end = _buffer.find("\r\n");
    if (end != std::string::npos) {
      std::string line = _buffer.substr(0, end);
      _buffer.erase(0, end + 2);
      return line;
    }
    if (_buffer.size() > kMaximumLineBytes) return Failure{"a chunk's size line is too long"};
    if (!fill()) return Failure{"the stream ended inside a chunked body"};
  }
}

Result<std::string> MessageReader::readChunkedBody(std::size_t maximumBytes) {
  std::string body;
  while (true) {
    auto line = readLine();
    if (!line) return line;
    const auto size = parseChunkSize(line.value());
    if (!size) return Failure{"not a chunk size: " + line.value()};
    if (*size == 0) break;
    if (*size > maximumBytes || body.size() + *size > maximumBytes) return Failure{"the chunked body is too long"};
    auto piece = readBody(*size);
    if (!piece) return piece;
    body += *piece;
    auto end = readLine();
    if (!end) return end;
    if (!end->empty()) return Failure{"a chunk does not end where it says"};
  }
  // Reads and drops the trailers.
  std::size_t trailerBytes = 0;
  while (true) {
    auto line = readLine();
    if (!line) return line;
    if (line->empty()) return body;
    trailerBytes += line->size();
    if (trailerBytes > kMaximumHeadBytes) return Failure{"the trailers are too long"};
  }
}

Result<std::string> inflateBody(std::string_view compressed, std::size_t maximumBytes) {
  if (compressed.size() > std::numeric_limits<uInt>::max()) return Failure{"the body is too long to inflate"};
  InflateStream inflating;
  if (!inflating.ready()) return Failure{"zlib cannot start"};
  z_stream& stream = *inflating;
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(compressed.data()));
  stream.avail_in = static_cast<uInt>(compressed.size());
  std::string body;
  int result = Z_OK;
  while (result == Z_OK) {
    const std::size_t before = body.size();
    if (before > maximumBytes) return Failure{fmt::format("the body inflates to more than {} bytes", maximumBytes)};
    const std::size_t room = std::clamp<std::size_t>(before, 16U << 10U, 1U << 20U);
    body.resize(before + room);
    stream.next_out = reinterpret_cast<Bytef*>(body.data() + before);
    stream.avail_out = static_cast<uInt>(room);
    result = inflate(&stream, Z_NO_FLUSH);
    body.resize(before + room - stream.avail_out);
  }
  if (result != Z_STREAM_END) {
    return Failure{
        fmt::format("the compressed body is damaged: {}", stream.msg != nullptr ? stream.msg : "it ends early")};
  }
  if (stream.avail_in != 0) return Failure{"bytes follow the compressed body"};
  if (body.size() > maximumBytes) return Failure{fmt::format("the body inflates to more than {} bytes", maximumBytes)};
  return body;
}

}  // namespace orvanta::collector
