#include "backends/https/PostURLs.h"

#include <utility>

#include "interface/OrvantaLogging.h"

namespace orvanta {

PostURLs::PostURLs(std::optional<std::string> postURL, std::optional<std::string> realtimePostURL)
    : _postURL(std::move(postURL)),
      _realtimePostURL(std::move(realtimePostURL)),
      _postURLFixed(_postURL.has_value()),
      _realtimePostURLFixed(_realtimePostURL.has_value()) {
  if (_postURL) ORVANTA_LOG(debug, "HTTPSPostBackend(initWithName): Using user default '{}' for postURL", *_postURL);
  if (_realtimePostURL) {
    ORVANTA_LOG(debug, "HTTPSPostBackend(initWithName): Using user default '{}' for realtimePostURL",
                *_realtimePostURL);
  }
}

void PostURLs::setPostURL(std::optional<std::string> url) {
  _postURL = std::move(url);
  if (!_postURL) _postURLFixed = false;
}

void PostURLs::update(const Dictionary& section) {
  if (const std::string* url = suppliedPostURL(section, _postURLFixed)) {
    _postURL = *url;
    ORVANTA_LOG(debug, "HTTPSPostBackend(updatePostLink): Storebag '{}' for postURL", *url);
  }
  if (_realtimePostURLFixed) return;
  if (const std::string* url = textUnder(section, StorebagKey::realtimePostURL)) {
    _realtimePostURL = *url;
    ORVANTA_LOG(debug, "HTTPSPostBackend(updatePostLink): Storebag '{}' for realtimePostURL", *url);
  } else {
    ORVANTA_LOG(debug, "HTTPSPostBackend(updatePostLink): realtimePostURL defaults to postURL '{}'",
                _postURL.value_or("(null)"));
    _realtimePostURL = _postURL;
  }
}

}  // namespace orvanta
