#pragma once

#include <string>
#include <string_view>

namespace orvanta::platform {

// An answer that may send a request elsewhere.
struct HttpRedirect {
  std::string_view method;
  std::string_view url;  // that gave the answer
  int status = 0;
  std::string_view target;  // absolute; empty when the answer does not name one
  int followed = 0;         // redirects of this request so far
  int maximum = 0;
};

enum class RedirectVerdict {
  answer,  // nothing to follow: the caller gets this answer
  follow,  // the same method and body go to the target
  insecure,
  unsupported,
  tooMany,
};

RedirectVerdict judgeRedirect(const HttpRedirect& redirect);
// The error text for a refused redirect.
std::string describeRefusal(RedirectVerdict verdict, const HttpRedirect& redirect);

bool isHttpUrl(std::string_view url);
bool isHttpsUrl(std::string_view url);

}  // namespace orvanta::platform
