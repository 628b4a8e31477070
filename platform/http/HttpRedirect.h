#pragma once

#include <string>
#include <string_view>

namespace orvanta::platform {

// An answer that may send a request elsewhere.
struct HttpRedirect {
  std::string_view method;
  std::string_view url;  // that gave the answer
  int status = 0;
  std::string_view target;  // absolute; empty when the answer names none
  int followed = 0;         // redirects of this request so far
  int maximum = 0;
};

enum class RedirectVerdict {
  answer,  // nothing to follow: this is what the caller gets
  follow,  // the same method and body go to the target
  insecure,
  unsupported,
  tooMany,
};

RedirectVerdict judgeRedirect(const HttpRedirect& redirect);
// What the caller gets to read when a redirect is refused.
std::string describeRefusal(RedirectVerdict verdict, const HttpRedirect& redirect);

bool isHttpUrl(std::string_view url);
bool isHttpsUrl(std::string_view url);

}  // namespace orvanta::platform
