#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include "interface/Values.h"
#include "tools/collector/wire/Transport.h"

namespace orvanta::collector {

// Takes HTTP/1 messages off a stream: heads, bodies of a known length, chunked bodies. Belongs to the thread of the
// stream. Nothing is allocated for bytes that have not come.
class MessageReader {
 public:
  explicit MessageReader(Transport& stream) : _stream(stream) {}

  static constexpr std::size_t kMaximumHeadBytes = 64U << 10U;

  // The next head with its empty line; none when the stream ended before one began, a failure when it ended inside or
  // the head is too long.
  Result<std::optional<std::string>> readHead();
  Result<std::string> readBody(std::size_t length);
  Result<std::string> readChunkedBody(std::size_t maximumBytes);
  // Reads and drops what still comes, up to a limit.
  void discard(std::size_t maximumBytes);

 private:
  // False when nothing more came.
  bool fill();
  Result<std::string> readLine();

  Transport& _stream;
  std::string _buffer;  // read and not yet taken
};

// Inflates a gzip or zlib body whole; a failure when it is damaged, has trailing bytes, or would pass `maximumBytes`.
Result<std::string> inflateBody(std::string_view compressed, std::size_t maximumBytes);

}  // namespace orvanta::collector
