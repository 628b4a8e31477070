#include "platform/http/CurlTransfer.h"

#include <fmt/format.h>

#include <utility>

namespace orvanta::platform {

namespace {

// A server could send headers, or interim answers, without end.
constexpr std::size_t kMaximumHeaderBytes = 256U << 10U;

std::string_view trimmed(std::string_view text) {
  constexpr std::string_view kBlank = " \t\r\n";
  const std::size_t begin = text.find_first_not_of(kBlank);
  if (begin == std::string_view::npos) return {};
  return text.substr(begin, text.find_last_not_of(kBlank) - begin + 1);
}

}  // namespace

std::unique_ptr<CurlTransfer> CurlTransfer::create(const HttpClientOptions& options) {
  CURL* const easy = curl_easy_init();
  if (easy == nullptr) return nullptr;
  return std::unique_ptr<CurlTransfer>(new CurlTransfer(easy, options));
}

CurlTransfer::CurlTransfer(CURL* easy, const HttpClientOptions& options) : _easy(easy), _options(options) {
  applyConstantOptions();
}

CurlTransfer::~CurlTransfer() {
  curl_easy_cleanup(_easy);
}

void CurlTransfer::applyConstantOptions() {
  curl_easy_setopt(_easy, CURLOPT_NOSIGNAL, 1L);
  // Only redirects judged by us are followed, hop by hop; the list stands for both.
  curl_easy_setopt(_easy, CURLOPT_FOLLOWLOCATION, 0L);
  curl_easy_setopt(_easy, CURLOPT_PROTOCOLS_STR, "http,https");
  curl_easy_setopt(_easy, CURLOPT_REDIR_PROTOCOLS_STR, "http,https");
  // A lane has one request in flight, so that HTTP/2 could save connections only across lanes.
  curl_easy_setopt(_easy, CURLOPT_HTTP_VERSION, static_cast<long>(CURL_HTTP_VERSION_1_1));
  // The answer to a proxy's CONNECT is not the server's.
  curl_easy_setopt(_easy, CURLOPT_SUPPRESS_CONNECT_HEADERS, 1L);

  curl_easy_setopt(_easy, CURLOPT_SSL_VERIFYPEER, 1L);
  curl_easy_setopt(_easy, CURLOPT_SSL_VERIFYHOST, 2L);
  curl_easy_setopt(_easy, CURLOPT_SSLVERSION, static_cast<long>(CURL_SSLVERSION_TLSv1_2));
  if (!_options.caFile.empty()) {
    curl_easy_setopt(_easy, CURLOPT_CAINFO, _options.caFile.c_str());
    curl_easy_setopt(_easy, CURLOPT_CAPATH, nullptr);  // the system's must not count beside it
  }

  const auto timeout = static_cast<long>(_options.limits.noProgress.count());
  curl_easy_setopt(_easy, CURLOPT_CONNECTTIMEOUT, timeout);
  curl_easy_setopt(_easy, CURLOPT_LOW_SPEED_LIMIT, 1L);
  curl_easy_setopt(_easy, CURLOPT_LOW_SPEED_TIME, timeout);
  // A resolver that hangs must not be waited for when the transfer is given up.
  curl_easy_setopt(_easy, CURLOPT_QUICK_EXIT, 1L);

  curl_easy_setopt(_easy, CURLOPT_ERRORBUFFER, _errorText.data());
  curl_easy_setopt(_easy, CURLOPT_HEADERDATA, this);
  curl_easy_setopt(
      _easy, CURLOPT_HEADERFUNCTION, +[](char* data, std::size_t, std::size_t count, void* self) {
        return static_cast<CurlTransfer*>(self)->receiveHeader({data, count});
      });
  curl_easy_setopt(_easy, CURLOPT_WRITEDATA, this);
  curl_easy_setopt(
      _easy, CURLOPT_WRITEFUNCTION, +[](char* data, std::size_t, std::size_t count, void* self) {
        return static_cast<CurlTransfer*>(self)->receiveBody({data, count});
      });
}

bool CurlTransfer::begin(const HttpRequest& request, HttpHeaderList headers) {
  _request = &request;
  _redirects = 0;
  _headerBytes = 0;
  _bodyBytes = 0;
  _tooLarge = false;
  return apply(request.url, std::move(headers));
}

bool CurlTransfer::beginRedirected(const std::string& url) {
  ++_redirects;
  return apply(url, makeHeaderList(*_request, true));
}

bool CurlTransfer::apply(const std::string& url, HttpHeaderList headers) {
  _response = HttpResponse();
  _headersEnded = false;
  _errorText[0] = 0;
  _url = url;
  const bool ok = headers && curl_easy_setopt(_easy, CURLOPT_URL, _url.c_str()) == CURLE_OK &&
                  curl_easy_setopt(_easy, CURLOPT_HTTPHEADER, headers.get()) == CURLE_OK;
  _headerList = std::move(headers);
  if (_request->method == "POST") {
    curl_easy_setopt(_easy, CURLOPT_POST, 1L);
    curl_easy_setopt(_easy, CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(_request->body.size()));
    curl_easy_setopt(_easy, CURLOPT_POSTFIELDS, _request->body.data());  // not copied
  } else {
    curl_easy_setopt(_easy, CURLOPT_HTTPGET, 1L);
  }
  return ok;
}

void CurlTransfer::reset() {
  curl_easy_setopt(_easy, CURLOPT_POSTFIELDS, nullptr);
  curl_easy_setopt(_easy, CURLOPT_HTTPHEADER, nullptr);
  curl_easy_setopt(_easy, CURLOPT_PRIVATE, nullptr);
  _headerList.reset();
  _request = nullptr;
  _response = HttpResponse();
}

int CurlTransfer::status() const {
  long status = 0;
  curl_easy_getinfo(_easy, CURLINFO_RESPONSE_CODE, &status);
  return static_cast<int>(status);
}

std::string CurlTransfer::redirectTarget() const {
  const char* target = nullptr;
  curl_easy_getinfo(_easy, CURLINFO_REDIRECT_URL, &target);
  return target != nullptr ? target : "";
}

HttpResponse CurlTransfer::takeResponse() {
  _response.status = status();
  return std::exchange(_response, HttpResponse());
}

std::string CurlTransfer::describeFailure(CURLcode code) const {
  if (_tooLarge) {
    return _headerBytes > kMaximumHeaderBytes
               ? fmt::format("The answer has more than {} bytes of headers", kMaximumHeaderBytes)
               : fmt::format("The answer is larger than {} bytes", _options.limits.responseBytes);
  }
  return _errorText[0] != 0 ? _errorText.data() : curl_easy_strerror(code);
}

bool CurlTransfer::wasConnected() const {
  curl_off_t microseconds = 0;
  curl_easy_getinfo(_easy, CURLINFO_PRETRANSFER_TIME_T, &microseconds);
  return microseconds > 0;
}

// Returning less than was given ends the transfer.
std::size_t CurlTransfer::receiveHeader(std::string_view line) {
  _headerBytes += line.size();
  if (_headerBytes > kMaximumHeaderBytes) {
    _tooLarge = true;
    return 0;
  }
  if (line.substr(0, 5) == "HTTP/") {  // an interim answer's headers make way for the final one's
    _response.headers.clear();
    _headersEnded = false;
  } else if (_headersEnded) {
    return line.size();
  } else if (const std::string_view content = trimmed(line); content.empty()) {
    _headersEnded = true;
  } else if ((line.front() == ' ' || line.front() == '\t') && !_response.headers.empty()) {
    _response.headers.back().value.append(" ").append(content);  // a folded line goes on with the one before
  } else if (const std::size_t colon = content.find(':'); colon != std::string_view::npos) {
    _response.headers.push_back(
        {std::string(trimmed(content.substr(0, colon))), std::string(trimmed(content.substr(colon + 1)))});
  }
  return line.size();
}

std::size_t CurlTransfer::receiveBody(std::string_view bytes) {
  _bodyBytes += bytes.size();
  if (_bodyBytes > _options.limits.responseBytes) {
    _tooLarge = true;
    return 0;
  }
  if (!_request->discardResponseBody) _response.body.append(bytes);
  return bytes.size();
}

}  // namespace orvanta::platform
