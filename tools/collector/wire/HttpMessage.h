#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "interface/Values.h"

namespace orvanta::collector {

// Parsing and writing parts of HTTP/1 messages, with the header fields in their order. Pure; any thread.

using HeaderFields = std::vector<std::pair<std::string, std::string>>;

// Returns the first field of that name, in any case; null if there is no such field.
const std::string* findHeader(const HeaderFields& headers, std::string_view name);

struct RequestHead {
  std::string method;
  std::string target;
  bool http11 = true;
  HeaderFields headers;

  bool chunked() const;
  // Returns whether the sender waits for "100 Continue" before it sends the body.
  bool expectsContinue() const;
  bool keepsAlive() const;
  // Nullopt if the header is absent; a failure if it is not a number or two of them differ.
  Result<std::optional<std::size_t>> contentLength() const;
};

struct ResponseHead {
  int status = 0;
  HeaderFields headers;
};

// `head` ends with the empty line.
Result<RequestHead> parseRequestHead(std::string_view head);
Result<ResponseHead> parseResponseHead(std::string_view head);

// Parses the size line of a chunk, given without its line break. Returns nullopt if it is invalid.
std::optional<std::size_t> parseChunkSize(std::string_view line);

// The path of a request target, percent-decoded.
std::string pathOfTarget(std::string_view target);
// Percent-decoded; nullopt if the parameter is absent.
std::optional<std::string> queryParameter(std::string_view target, std::string_view name);

std::string_view reasonPhrase(int status);

// "Sun, 06 Nov 1994 08:49:37 GMT".
std::string httpDate(std::int64_t secondsSince1970);
// Returns nullopt for any other form.
std::optional<std::int64_t> parseHttpDate(const std::string& text);

}  // namespace orvanta::collector
