#include "platform/http/HttpHeaderList.h"

#include <algorithm>
#include <initializer_list>
#include <string>
#include <string_view>

#include "platform/core/Log.h"
#include "platform/core/Text.h"

namespace orvanta::platform {

namespace {

bool isAnyOf(std::string_view name, std::initializer_list<std::string_view> names) {
  return std::any_of(names.begin(), names.end(),
                     [&](std::string_view other) { return equalsIgnoringCase(name, other); });
}

bool isTokenCharacter(char c) {
  constexpr std::string_view kMarks = "!#$%&'*+-.^_`|~";
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
         kMarks.find(c) != std::string_view::npos;
}
bool isName(std::string_view name) {
  return !name.empty() && std::all_of(name.begin(), name.end(), isTokenCharacter);
}
bool isControl(char c) {
  return static_cast<unsigned char>(c) < 0x20 || c == 0x7f;
}

const char* whyLeftOut(const HttpHeader& header) {
  if (!isName(header.name)) return "its name is not a header name";
  if (std::any_of(header.value.begin(), header.value.end(), isControl)) return "its value holds control characters";
  if (isAnyOf(header.name, {"Transfer-Encoding", "Expect"})) return "how the body travels is not the caller's to say";
  return nullptr;
}

// libcurl writes "Name;" as a header with an empty value, and takes one of blanks only for no header at all.
std::string lineOf(std::string_view name, std::string_view value) {
  std::string line(name);
  if (value.find_first_not_of(' ') == std::string_view::npos) return line += ';';
  return line.append(": ").append(value);
}

}  // namespace

HttpHeaderList makeHeaderList(const HttpRequest& request, bool redirected) {
  HttpHeaderList list;
  bool ok = true;
  const auto append = [&](const char* line) {
    curl_slist* const longer = curl_slist_append(list.get(), line);
    ok = ok && longer != nullptr;
    if (longer != nullptr && !list) list.reset(longer);
  };
  const bool post = request.method == "POST";
  bool hasAccept = false;
  bool hasType = false;
  bool hasLength = false;
  for (const HttpHeader& header : request.headers) {
    if (const char* reason = whyLeftOut(header)) {
      if (!redirected) PLATFORM_LOG(warning, "HttpClient: Header {} is left out: {}", header.name, reason);
      continue;
    }
    if (redirected && isAnyOf(header.name, {"Host", "Authorization", "Cookie"})) continue;
    if (isAnyOf(header.name, {"Content-Length"})) {
      if (post && !hasLength) append(lineOf(header.name, std::to_string(request.body.size())).c_str());
      hasLength = true;
      continue;
    }
    hasAccept = hasAccept || isAnyOf(header.name, {"Accept"});
    hasType = hasType || isAnyOf(header.name, {"Content-Type"});
    append(lineOf(header.name, header.value).c_str());
  }
  if (!hasAccept) append("Accept:");
  if (post && !hasType) append("Content-Type:");
  append("Expect:");
  if (!ok) list.reset();
  return list;
}

}  // namespace orvanta::platform
