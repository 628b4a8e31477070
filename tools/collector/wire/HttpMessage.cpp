#include "tools/collector/wire/HttpMessage.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <charconv>
#include <ctime>

#include "platform/core/Text.h"

namespace orvanta::collector {

namespace {

std::string_view trimmed(std::string_view text) {
  const auto first = text.find_first_not_of(" \t");
  if (first == std::string_view::npos) return {};
  return text.substr(first, text.find_last_not_of(" \t") - first + 1);
}

// Removes the first line and its line break from `rest`; returns nullopt if there is no line break.
std::optional<std::string_view> takeLine(std::string_view& rest) {
  const auto end = rest.find("\r\n");
  if (end == std::string_view::npos) return std::nullopt;
  const auto line = rest.substr(0, end);
  rest.remove_prefix(end + 2);
  return line;
}

// The header lines of `rest` up to the empty line.
Result<HeaderFields> parseHeaders(std::string_view rest) {
  HeaderFields headers;
  while (true) {
    const auto line = takeLine(rest);
    if (!line) return Failure{"the head has no end"};
    if (line->empty()) return headers;
    const auto colon = line->find(':');
    if (colon == std::string_view::npos || colon == 0) return Failure{fmt::format("not a header line: {}", *line)};
    const auto name = line->substr(0, colon);
    if (name.find_first_of(" \t") != std::string_view::npos) return Failure{fmt::format("not a header name: {}", name)};
    headers.emplace_back(std::string(name), std::string(trimmed(line->substr(colon + 1))));
  }
}

}  // namespace

bool RequestHead::chunked() const {
  const std::string* encoding = findHeader(headers, "Transfer-Encoding");
  return encoding != nullptr && platform::equalsIgnoringCase(*encoding, "chunked");
}

bool RequestHead::expectsContinue() const {
  const std::string* expect = findHeader(headers, "Expect");
  return expect != nullptr && platform::equalsIgnoringCase(*expect, "100-continue");
}

bool RequestHead::keepsAlive() const {
  const std::string* connection = findHeader(headers, "Connection");
  if (connection == nullptr) return http11;
  if (platform::equalsIgnoringCase(*connection, "close")) return false;
  return http11 || platform::equalsIgnoringCase(*connection, "keep-alive");
}

Result<std::optional<std::size_t>> RequestHead::contentLength() const {
  std::optional<std::size_t> length;
  for (const auto& [name, value] : headers) {
    if (!platform::equalsIgnoringCase(name, "Content-Length")) continue;
    std::size_t number = 0;
    const auto [end, error] = std::from_chars(value.data(), value.data() + value.size(), number);
    if (error != std::errc() || end != value.data() + value.size())
      return Failure{"Content-Length is not a number: " + value};
    if (length && *length != number) return Failure{"two Content-Length headers differ"};
    length = number;
  }
  return length;
}

Result<RequestHead> parseRequestHead(std::string_view head) {
  std::string_view rest = head;
  const auto line = takeLine(rest);
  if (!line) return Failure{"the head has no end"};
  const auto first = line->find(' ');
  const auto last = line->rfind(' ');
  if (first == std::string_view::npos || first == 0 || last <= first + 1)
    return Failure{fmt::format("not a request line: {}", *line)};
  RequestHead request;
  request.method = line->substr(0, first);
  request.target = line->substr(first + 1, last - first - 1);
  const auto version = line->substr(last + 1);
  if (version != "HTTP/1.1" && version != "HTTP/1.0") return Failure{fmt::format("unknown protocol {}", version)};
  request.http11 = version == "HTTP/1.1";
  if (request.target.find(' ') != std::string::npos) return Failure{fmt::format("not a request line: {}", *line)};
  auto headers = parseHeaders(rest);
  if (!headers) return Failure{headers.error()};
  request.headers = std::move(headers.value());
  return request;
}

Result<ResponseHead> parseResponseHead(std::string_view head) {
  std::string_view rest = head;
  const auto line = takeLine(rest);
  // "HTTP/1.1 200 ..." at the least.
  if (!line || line->size() < 12 || line->substr(0, 7) != "HTTP/1.") return Failure{"not a status line"};
  ResponseHead response;
  const auto [end, error] = std::from_chars(line->data() + 9, line->data() + 12, response.status);
  if (error != std::errc() || end != line->data() + 12) return Failure{"not a status line"};
  auto headers = parseHeaders(rest);
  if (!headers) return Failure{headers.error()};
  response.headers = std::move(headers.value());
  return response;
}

std::optional<std::size_t> parseChunkSize(std::string_view line) {
  const auto digits = trimmed(line.substr(0, line.find(';')));
  std::size_t size = 0;
  const auto [end, error] = std::from_chars(digits.data(), digits.data() + digits.size(), size, 16);
  if (digits.empty() || error != std::errc() || end != digits.data() + digits.size()) return std::nullopt;
  return size;
}

std::string pathOfTarget(std::string_view target) {
  return platform::percentDecode(target.substr(0, target.find('?')));
}

std::optional<std::string> queryParameter(std::string_view target, std::string_view name) {
  const auto question = target.find('?');
  if (question == std::string_view::npos) return std::nullopt;
  std::string_view rest = target.substr(question + 1);
  while (!rest.empty()) {
    const auto end = std::min(rest.find('&'), rest.size());
    const auto pair = rest.substr(0, end);
    const auto equals = std::min(pair.find('='), pair.size());
    if (platform::percentDecode(pair.substr(0, equals)) == name) {
      return platform::percentDecode(pair.substr(std::min(equals + 1, pair.size())));
    }
    rest.remove_prefix(std::min(end + 1, rest.size()));
  }
  return std::nullopt;
}

std::string_view reasonPhrase(int status) {
  constexpr std::array<std::pair<int, std::string_view>, 22> kPhrases{{{200, "OK"},
                                                                       {201, "Created"},
                                                                       {202, "Accepted"},
                                                                       {204, "No Content"},
                                                                       {301, "Moved Permanently"},
                                                                       {302, "Found"},
                                                                       {303, "See Other"},
                                                                       {304, "Not Modified"},
                                                                       {307, "Temporary Redirect"},
                                                                       {308, "Permanent Redirect"},
                                                                       {400, "Bad Request"},
                                                                       {401, "Unauthorized"},
                                                                       {403, "Forbidden"},
                                                                       {404, "Not Found"},
                                                                       {408, "Request Timeout"},
                                                                       {413, "Payload Too Large"},
                                                                       {429, "Too Many Requests"},
                                                                       {500, "Internal Server Error"},
                                                                       {501, "Not Implemented"},
                                                                       {502, "Bad Gateway"},
                                                                       {503, "Service Unavailable"},
                                                                       {504, "Gateway Timeout"}}};
  for (const auto& [code, phrase] : kPhrases) {
    if (code == status) return phrase;
  }
  return "Status";
}

std::string httpDate(std::int64_t secondsSince1970) {
  const std::time_t time = secondsSince1970;
  std::tm parts{};
  ::gmtime_r(&time, &parts);
  constexpr std::array<const char*, 7> kDays{"Sun", "Mon", "Tue", "Wed", "Thu", "Fri", "Sat"};
  constexpr std::array<const char*, 12> kMonths{"Jan", "Feb", "Mar", "Apr", "May", "Jun",
                                                "Jul", "Aug", "Sep", "Oct", "Nov", "Dec"};
  return fmt::format("{}, {:02} {} {} {:02}:{:02}:{:02} GMT", kDays[static_cast<std::size_t>(parts.tm_wday)],
                     parts.tm_mday, kMonths[static_cast<std::size_t>(parts.tm_mon)], parts.tm_year + 1900,
                     parts.tm_hour, parts.tm_min, parts.tm_sec);
}

std::optional<std::int64_t> parseHttpDate(const std::string& text) {
  std::tm parts{};
  const char* end = ::strptime(text.c_str(), "%a, %d %b %Y %H:%M:%S GMT", &parts);
  if (end == nullptr || *end != '\0') return std::nullopt;
  return ::timegm(&parts);
}

const std::string* findHeader(const HeaderFields& headers, std::string_view name) {
  for (const auto& [key, value] : headers) {
    if (platform::equalsIgnoringCase(key, name)) return &value;
  }
  return nullptr;
}

}  // namespace orvanta::collector
