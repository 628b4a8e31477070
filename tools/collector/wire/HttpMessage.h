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

// Reading HTTP/1 messages as bytes, with the header fields in their order. No I/O.

using HeaderFields = std::vector<std::pair<std::string, std::string>>;

// The first field of that name, in any case; null when there is none.
const std::string* findHeader(const HeaderFields& headers, std::string_view name);

struct RequestHead {
  std::string method;
  std::string target;
  bool http11 = true;
  HeaderFields headers;

  bool chunked() const;
  // Whether the sender waits for "100 Continue" before it sends the body.
  bool expectsContinue() const;
  bool keepsAlive() const;
  // None where there is no such header; a failure where it is no number or there are two that differ.
  Result<std::optional<std::size_t>> contentLength() const;
};

struct ResponseHead {
  int status = 0;
  HeaderFields headers;
};

// `head` ends with the empty line.
Result<RequestHead> parseRequestHead(std::string_view head);
Result<ResponseHead> parseResponseHead(std::string_view head);

// One step of the chunked form: the size line of the next chunk, without its line break.
std::optional<std::size_t> parseChunkSize(std::string_view line);

// The path of a request target, percent-decoded.
std::string pathOfTarget(std::string_view target);
std::optional<std::string> queryParameter(std::string_view target, std::string_view name);

std::string_view reasonPhrase(int status);

// "Sun, 06 Nov 1994 08:49:37 GMT".
std::string httpDate(std::int64_t secondsSince1970);
std::optional<std::int64_t> parseHttpDate(const std::string& text);

}  // namespace orvanta::collector
