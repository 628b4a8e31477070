#pragma once

#include <curl/curl.h>

#include <array>
#include <cstddef>
#include <memory>
#include <string>
#include <string_view>

#include "platform/http/HttpClient.h"
#include "platform/http/HttpHeaderList.h"

namespace orvanta::platform {

// One libcurl handle with what belongs to it: a request on its way out and the answer on its way in. Kept and used
// again for later requests, which is three times cheaper than a new one. Owned by the HTTP thread and touched only
// there.
class CurlTransfer {
 public:
  // Null when libcurl cannot make a handle. `options` outlives the transfer.
  static std::unique_ptr<CurlTransfer> create(const HttpClientOptions& options);
  ~CurlTransfer();
  CurlTransfer(const CurlTransfer&) = delete;
  CurlTransfer& operator=(const CurlTransfer&) = delete;

  CURL* handle() const { return _easy; }

  // Makes the handle ready to send `request`, which stays where it is until the end, with these headers. Returns
  // false when memory is short.
  bool begin(const HttpRequest& request, HttpHeaderList headers);
  // The same request once more, to `url`, after a redirect.
  bool beginRedirected(const std::string& url);
  // Ends the use of the request; what was received is dropped. The handle must not be in a multi handle.
  void reset();

  // After libcurl is done with the handle.
  int status() const;
  // The absolute URL that the answer redirects to; empty when it does not.
  std::string redirectTarget() const;
  const std::string& url() const { return _url; }
  int redirects() const { return _redirects; }
  // The answer, taken out.
  HttpResponse takeResponse();
  // Why it failed, with the TLS library's reason where TLS failed.
  std::string describeFailure(CURLcode code) const;
  // Returns whether the request is known to have got a connection, for error texts.
  bool wasConnected() const;

 private:
  CurlTransfer(CURL* easy, const HttpClientOptions& options);

  void applyConstantOptions();
  bool apply(const std::string& url, HttpHeaderList headers);
  std::size_t receiveHeader(std::string_view line);
  std::size_t receiveBody(std::string_view bytes);

  // Constant after construction.
  CURL* const _easy;
  const HttpClientOptions& _options;

  const HttpRequest* _request = nullptr;  // null between requests
  HttpHeaderList _headerList;
  std::string _url;
  int _redirects = 0;
  HttpResponse _response;
  bool _headersEnded = false;    // what follows are trailers, which are not kept
  std::size_t _headerBytes = 0;  // of all hops and interim answers
  std::size_t _bodyBytes = 0;    // of all hops
  bool _tooLarge = false;
  std::array<char, CURL_ERROR_SIZE> _errorText{};
};

}  // namespace orvanta::platform
