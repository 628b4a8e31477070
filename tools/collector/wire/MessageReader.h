#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include "interface/Values.h"
#include "tools/collector/wire/Transport.h"

namespace orvanta::collector {

// Reads HTTP/1 messages from a stream: heads, bodies of a known length, chunked bodies. Belongs to the thread of the
// stream. Allocates nothing for bytes that have not arrived. After a failure the stream is of no further use.
class MessageReader {
 public:
  explicit MessageReader(Transport& stream) : _stream(stream) {}

  static constexpr std::size_t kMaximumHeadBytes = 64U << 10U;
  // The error by which callers tell a head that is too long from a stream that has ended.
  static constexpr const char* kHeadTooLong = "the head is too long";

  // The next head with its empty line; nullopt if the stream ended before a head began; a failure if it ended inside
  // the head or the head is too long.
  Result<std::optional<std::string>> readHead();
  Result<std::string> readBody(std::size_t length);
  Result<std::string> readChunkedBody(std::size_t maximumBytes);
  // Reads and drops the rest of the stream, up to a limit.
  void discard(std::size_t maximumBytes);

 private:
  // Reads more into the buffer. Returns false at the end of the stream.
  bool fill();
  Result<std::string> readLine();

  Transport& _stream;
  std::string _buffer;  // read and not yet returned
};

// Inflates a gzip or zlib body. Fails if it is damaged, has trailing bytes, or would exceed `maximumBytes`.
Result<std::string> inflateBody(std::string_view compressed, std::size_t maximumBytes);

}  // namespace orvanta::collector
