#pragma once

#include <optional>
#include <string>

#include "backends/https/ClientSection.h"
#include "interface/Values.h"

namespace orvanta {

// The post URL that a storebag's section supplies; null where it has no URL or a user default has fixed the URL. The
// first section that supplies one also says how events are counted.
inline const std::string* suppliedPostURL(const Dictionary& section, bool fixed) {
  return fixed ? nullptr : textUnder(section, StorebagKey::postURL);
}

// Where a backend posts to. A URL that a user default gives stays; else each section of the storebag that is looked at
// replaces the earlier. Used on the session's queue.
class PostURLs {
 public:
  // From the user defaults.
  PostURLs(std::optional<std::string> postURL, std::optional<std::string> realtimePostURL);

  // Takes the section's URLs where no user default has fixed them. Realtime events without a URL of their own go where
  // others go.
  void update(const Dictionary& section);

  bool postURLFixed() const { return _postURLFixed; }
  // May be absent.
  const std::optional<std::string>& postURL() const { return _postURL; }
  const std::optional<std::string>& realtimePostURL() const { return _realtimePostURL; }
  void setPostURL(std::optional<std::string> url);

 private:
  std::optional<std::string> _postURL;
  std::optional<std::string> _realtimePostURL;
  bool _postURLFixed;
  bool _realtimePostURLFixed;
};

}  // namespace orvanta
