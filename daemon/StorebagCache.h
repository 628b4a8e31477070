#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <string>

#include "config/Storebag.h"
#include "interface/Values.h"
#include "platform/core/Clock.h"

namespace orvanta {

enum class StorebagFetchState { successful, failure };  // "Fetch Successful", "Fetch Failure"

// One storebag as far as it is known. Made by the first attempt to fetch it and kept for the life of the process.
struct StorebagCacheEntry {
  SharedDictionary storebagData;               // of the last fetch that brought one
  std::optional<std::string> storebagVersion;  // together with storebagData
  double storebagFetchTime = 0;                // wall clock, of the last attempt
  StorebagFetchState storebagFetchState = StorebagFetchState::failure;
  std::int32_t storebagMaxAge = 0;  // seconds; of the last attempt
  std::optional<std::string> storebagLastModified;
};

// Returns whether the entry serves as it is at `now`, and else why not. Pure.
enum class StorebagFreshness { fresh, waiting, expired };
StorebagFreshness freshnessOf(const StorebagCacheEntry& entry, double now);

// One entry per storebag name; asks the server when an entry has expired, and after a failure not before 900 seconds.
//
// Owned by the agent, used under its lock, which is held across a fetch: concurrent sessions never fetch twice for one
// expiry.
class StorebagCache {
 public:
  using Fetch = std::function<SharedDictionary(std::int32_t clientType, StorebagFetch& fetch)>;
  StorebagCache(platform::Clock& clock, Fetch fetch) : _clock(clock), _fetch(std::move(fetch)) {}

  // Returns null when no fetch has succeeded, or the client type has no storebag.
  SharedDictionary storebag(std::int32_t clientType);
  // Never fetches.
  std::optional<std::string> version(std::int32_t clientType) const;

  static constexpr int kSecondsBetweenFailedAttempts = 900;

 private:
  void fetchAndCacheStorebag(std::int32_t clientType);

  platform::Clock& _clock;
  const Fetch _fetch;
  std::map<std::string, StorebagCacheEntry, std::less<>> _cachedStorebags;  // guarded by the agent's lock
};

}  // namespace orvanta
