#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace orvanta {

// Deflates the whole input in one pass into a gzip member (or a zlib stream). Nullopt on failure, which is logged.
// Thread-safe: each thread keeps one stream per container, so that a small body does not pay for setting one up.
std::optional<std::string> compressDataWithZlibOrGzip(bool gzip, std::string_view input);
std::optional<std::string> gzipDeflate(std::string_view input);

// The log's text for a failed deflateInit2 (or the reset of a kept stream) and of a failed deflate.
const char* describeDeflateInitResult(int zlibResult);
const char* describeDeflateResult(int zlibResult);

}  // namespace orvanta
