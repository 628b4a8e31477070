#include "tools/collector/wire/BodyDecoder.h"

#include <fmt/format.h>
#include <zlib.h>

#include <algorithm>
#include <limits>

namespace orvanta::collector {

namespace {

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
