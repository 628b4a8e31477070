#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "config/ConfigServices.h"
#include "interface/Values.h"
#include "platform/host/Digest.h"

namespace orvanta {

// The signed remote configuration: fetching, verifying, choosing a section. See docs/storebag.md.

// The text of a key of the daemon's user defaults; nullopt when it has no value.
std::optional<std::string> userDefaultStringForKey(Platform& platform, std::string_view key);

bool verifyStorebagSignature(const platform::RsaPublicKey& key, std::span<const std::uint8_t> bag,
                             std::span<const std::uint8_t> signature);

// How long, in seconds, an answer with that Cache-Control header stays fresh; a day when the header is missing or does
// not say.
std::int32_t maxAgeFromCacheControl(std::optional<std::string_view> cacheControl);

// The result of a fetch besides the bag.
struct StorebagFetch {
  // In: the stamp to send; out: replaced by a newer one. Without a value at the call no stamp is sent.
  std::optional<std::string> lastModified;
  std::int32_t maxAge = 0;   // seconds; written whenever the server answered
  bool notModified = false;  // the server says that nothing has changed since the stamp
  std::string version;       // of the bag that came back
};

// One attempt to get the bag of that name: the inner bag, or null. Blocks for the network, at most 15 seconds. Does not
// write `version`.
SharedDictionary fetchStorebagWithName(ConfigServices& services, const std::string& name, StorebagFetch& fetch);

// The section of the current environment from the bag of that client type: backend name to profile, or null. A client
// type without a storebag is refused with a log line and no request.
SharedDictionary fetchStorebagForEnvironmentAndClientType(ConfigServices& services, std::int32_t clientType,
                                                          StorebagFetch& fetch);

}  // namespace orvanta
