#include "daemon/StorebagCache.h"

#include <cmath>

#include "config/ClientTypes.h"
#include "interface/OrvantaLogging.h"

namespace orvanta {

StorebagFreshness freshnessOf(const StorebagCacheEntry& entry, double now) {
  // A clock that was moved backwards makes stamps of the future; they count by their distance.
  const double age = std::fabs(now - entry.storebagFetchTime);
  if (entry.storebagFetchState == StorebagFetchState::successful) {
    return age < entry.storebagMaxAge ? StorebagFreshness::fresh : StorebagFreshness::expired;
  }
  return age < StorebagCache::kSecondsBetweenFailedAttempts ? StorebagFreshness::waiting : StorebagFreshness::expired;
}

SharedDictionary StorebagCache::storebag(std::int32_t clientType) {
  const auto name = storebagNameForClientType(clientType);
  if (!name) {
    // No entry is made for it; the fetch refuses it with the line that says so.
    StorebagFetch refused;
    return _fetch(clientType, refused);
  }
  if (const auto found = _cachedStorebags.find(*name); found != _cachedStorebags.end()) {
    switch (freshnessOf(found->second, _clock.wallSeconds())) {
      case StorebagFreshness::fresh:
        ORVANTA_LOG(debug, "storebagForSession: Cached storebag found for client type {}", clientType);
        return found->second.storebagData;
      case StorebagFreshness::waiting:
        ORVANTA_LOG(info,
                    "storebagForSession: Not fetching storebag for client type {} - must wait {} seconds between "
                    "attempts",
                    clientType, kSecondsBetweenFailedAttempts);
        return found->second.storebagData;
      case StorebagFreshness::expired:
        break;
    }
  }
  fetchAndCacheStorebag(clientType);
  return _cachedStorebags.find(*name)->second.storebagData;
}

void StorebagCache::fetchAndCacheStorebag(std::int32_t clientType) {
  ORVANTA_LOG(debug, "fetchAndCacheStorebag: Fetching storebag for client type {}", clientType);
  auto& entry = _cachedStorebags[std::string(*storebagNameForClientType(clientType))];
  StorebagFetch fetch;
  fetch.lastModified = entry.storebagLastModified;
  const auto storebag = _fetch(clientType, fetch);
  ORVANTA_LOG(debug, "fetchAndCacheStorebag: Storebag max age: {} seconds", fetch.maxAge);
  if (storebag) {
    entry.storebagData = storebag;
    entry.storebagVersion = fetch.version;
  } else if (!fetch.notModified) {
    ORVANTA_LOG(error, "fetchAndCacheStorebag: Unable to fetch storebag for client type {}", clientType);
  }
  entry.storebagFetchTime = _clock.wallSeconds();
  entry.storebagFetchState =
      storebag || fetch.notModified ? StorebagFetchState::successful : StorebagFetchState::failure;
  entry.storebagMaxAge = fetch.maxAge;
  if (fetch.lastModified) entry.storebagLastModified = fetch.lastModified;
}

std::optional<std::string> StorebagCache::version(std::int32_t clientType) const {
  const auto name = storebagNameForClientType(clientType);
  if (!name) return std::nullopt;
  const auto found = _cachedStorebags.find(*name);
  return found == _cachedStorebags.end() ? std::nullopt : found->second.storebagVersion;
}

}  // namespace orvanta
