#include "platform/http/HttpClient.h"

#include <strings.h>

#include <algorithm>

namespace orvanta::platform {

const std::string* HttpResponse::header(std::string_view name) const {
  const auto found = std::find_if(headers.begin(), headers.end(), [&](const HttpHeader& header) {
    return header.name.size() == name.size() && ::strncasecmp(header.name.data(), name.data(), name.size()) == 0;
  });
  return found == headers.end() ? nullptr : &found->value;
}

}  // namespace orvanta::platform
