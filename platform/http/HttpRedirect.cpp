#include "platform/http/HttpRedirect.h"

#include <fmt/format.h>

#include "platform/core/Text.h"

namespace orvanta::platform {

namespace {

bool startsWith(std::string_view text, std::string_view prefix) {
  return equalsIgnoringCase(text.substr(0, prefix.size()), prefix);
}

// 303 asks for a GET, and of 301 and 302 many make one: an emptied POST would deliver nothing and look delivered.
bool keepsMethod(int status) {
  return status == 307 || status == 308;
}
bool isRedirect(int status) {
  return keepsMethod(status) || (status >= 301 && status <= 303);
}

}  // namespace

bool isHttpUrl(std::string_view url) {
  return startsWith(url, "http://");
}
bool isHttpsUrl(std::string_view url) {
  return startsWith(url, "https://");
}

RedirectVerdict judgeRedirect(const HttpRedirect& redirect) {
  if (!isRedirect(redirect.status) || redirect.target.empty()) return RedirectVerdict::answer;
  if (redirect.method != "GET" && !keepsMethod(redirect.status)) return RedirectVerdict::answer;
  if (redirect.followed >= redirect.maximum) return RedirectVerdict::tooMany;
  if (isHttpsUrl(redirect.target)) return RedirectVerdict::follow;
  if (!isHttpUrl(redirect.target)) return RedirectVerdict::unsupported;
  return isHttpsUrl(redirect.url) ? RedirectVerdict::insecure : RedirectVerdict::follow;
}

std::string describeRefusal(RedirectVerdict verdict, const HttpRedirect& redirect) {
  switch (verdict) {
    case RedirectVerdict::insecure:
      return fmt::format("Redirect from https to {} refused", redirect.target);
    case RedirectVerdict::unsupported:
      return fmt::format("Redirect to {} refused: neither http nor https", redirect.target);
    case RedirectVerdict::tooMany:
      return fmt::format("More than {} redirects", redirect.maximum);
    case RedirectVerdict::answer:
    case RedirectVerdict::follow:
      break;
  }
  return {};
}

}  // namespace orvanta::platform
