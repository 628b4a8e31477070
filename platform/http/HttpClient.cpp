#include "platform/http/HttpClient.h"

#include <algorithm>

#include "platform/core/Text.h"

namespace orvanta::platform {

const std::string* HttpResponse::header(std::string_view name) const {
  const auto found = std::find_if(headers.begin(), headers.end(),
                                  [&](const HttpHeader& header) { return equalsIgnoringCase(header.name, name); });
  return found == headers.end() ? nullptr : &found->value;
}

}  // namespace orvanta::platform
