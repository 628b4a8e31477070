#pragma once

#include <curl/curl.h>

#include <memory>

#include "platform/http/HttpClient.h"

namespace orvanta::platform {

struct HttpHeaderListDeleter {
  void operator()(curl_slist* list) const { curl_slist_free_all(list); }
};
using HttpHeaderList = std::unique_ptr<curl_slist, HttpHeaderListDeleter>;

// The headers of a request in libcurl's notation: the caller's in their order, and entries that keep libcurl from
// adding its own. Logs each header that is left out: one whose value holds control characters or whose name is not
// a header name, and those of the message's framing, which is libcurl's. A Content-Length always says the body's
// length.
//
// `redirected`: without what was meant for the first server alone (Host, Authorization, Cookie), and without logging.
// Null when memory is short.
HttpHeaderList makeHeaderList(const HttpRequest& request, bool redirected);

}  // namespace orvanta::platform
