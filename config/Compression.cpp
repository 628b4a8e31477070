#include "config/Compression.h"

#include <zlib.h>

#include <algorithm>
#include <limits>
#include <memory>

#include "interface/OrvantaLogging.h"

namespace orvanta {

namespace {

constexpr int kGzipWindowBits = 15 + 16;
constexpr int kZlibWindowBits = 15;
constexpr int kMemoryLevel = 8;
constexpr std::size_t kLargestStep = std::numeric_limits<uInt>::max();  // zlib counts one step's bytes in an uInt

// A deflate stream that is set up on first use and reset for each further one. One thread's own.
class DeflateStream {
 public:
  explicit DeflateStream(int windowBits) : _windowBits(windowBits) {}
  ~DeflateStream() { end(); }
  DeflateStream(const DeflateStream&) = delete;
  DeflateStream& operator=(const DeflateStream&) = delete;

  int begin() {
    if (_ready) {
      const int result = ::deflateReset(&_stream);
      if (result != Z_OK) end();
      return result;
    }
    _stream = z_stream{};
    const int result =
        ::deflateInit2(&_stream, Z_DEFAULT_COMPRESSION, Z_DEFLATED, _windowBits, kMemoryLevel, Z_DEFAULT_STRATEGY);
    _ready = result == Z_OK;
    return result;
  }

  void end() {
    if (_ready) ::deflateEnd(&_stream);
    _ready = false;
  }

  z_stream* operator->() { return &_stream; }
  z_stream* get() { return &_stream; }

 private:
  const int _windowBits;
  z_stream _stream{};
  bool _ready = false;
};

DeflateStream& streamOfThisThread(bool gzip) {
  thread_local DeflateStream gzipStream(kGzipWindowBits);
  thread_local DeflateStream zlibStream(kZlibWindowBits);
  return gzip ? gzipStream : zlibStream;
}

const char* messageOf(DeflateStream& stream) {
  return stream->msg == nullptr ? "(null)" : stream->msg;
}

}  // namespace

const char* describeDeflateInitResult(int zlibResult) {
  switch (zlibResult) {
    case Z_VERSION_ERROR:
      return "The version of zlib.h and the version of the library linked do not match.";
    case Z_MEM_ERROR:
      return "Insufficient memory.";
    case Z_STREAM_ERROR:
      return "Invalid parameter passed in to function.";
    default:
      return "Unknown error code.";
  }
}

const char* describeDeflateResult(int zlibResult) {
  switch (zlibResult) {
    case Z_VERSION_ERROR:
      return "The version of zlib.h and the version of the library linked do not match.";
    case Z_BUF_ERROR:
      return "Ran out of output buffer for writing compressed bytes.";
    case Z_MEM_ERROR:
      return "Memory could not be allocated for processing.";
    case Z_DATA_ERROR:
      return "The deflate data was invalid or incomplete.";
    case Z_STREAM_ERROR:
      return "The stream state was inconsistent (e.g., next_in or next_out was NULL).";
    case Z_ERRNO:
      return "Error occured while reading file.";
    default:
      return "Unknown error code.";
  }
}

std::optional<std::string> compressDataWithZlibOrGzip(bool gzip, std::string_view input) {
  if (input.empty()) {
    ORVANTA_LOG(error, "compressDataWithZlibOrGzip: Cannot compress empty Dacto");
    return std::nullopt;
  }
  DeflateStream& stream = streamOfThisThread(gzip);
  if (const int result = stream.begin(); result != Z_OK) {
    ORVANTA_LOG(error, "compressDataWithZlibOrGzip: deflateInit2() Error: \"{}\" Message: \"{}\"",
                describeDeflateInitResult(result), messageOf(stream));
    return std::nullopt;
  }
  // zlib writes the buffer from its beginning, so it need not be cleared; it is copied once, at its final length.
  const std::size_t bound = ::deflateBound(stream.get(), input.size());
  const auto buffer = std::make_unique_for_overwrite<Bytef[]>(bound);
  std::size_t unread = input.size();
  stream->next_in = reinterpret_cast<Bytef*>(const_cast<char*>(input.data()));  // zlib only reads it
  stream->avail_in = 0;
  int result = Z_OK;
  while (result == Z_OK) {
    if (stream->avail_in == 0) {
      stream->avail_in = static_cast<uInt>(std::min(unread, kLargestStep));
      unread -= stream->avail_in;
    }
    stream->next_out = buffer.get() + stream->total_out;
    stream->avail_out = static_cast<uInt>(std::min(bound - stream->total_out, kLargestStep));
    result = ::deflate(stream.get(), unread == 0 ? Z_FINISH : Z_NO_FLUSH);
  }
  if (result != Z_STREAM_END) {
    ORVANTA_LOG(error, "compressDataWithZlibOrGzip: zlib error while attempting compression: \"{}\" Message: \"{}\"",
                describeDeflateResult(result), messageOf(stream));
    stream.end();
    return std::nullopt;
  }
  ORVANTA_LOG(debug, "compressDataWithZlibOrGzip: Compressed file from {} to {}", input.size(), stream->total_out);
  return std::string(reinterpret_cast<const char*>(buffer.get()), stream->total_out);
}

std::optional<std::string> gzipDeflate(std::string_view input) {
  return compressDataWithZlibOrGzip(true, input);
}

}  // namespace orvanta
