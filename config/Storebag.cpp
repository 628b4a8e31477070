#include "config/Storebag.h"

#include <algorithm>
#include <chrono>
#include <cstdlib>
#include <limits>
#include <utility>
#include <vector>

#include "config/ClientTypes.h"
#include "config/StorebagKeys.h"
#include "interface/OrvantaConstants.h"
#include "interface/OrvantaLogging.h"
#include "platform/codec/PropertyList.h"
#include "platform/core/Text.h"

namespace orvanta {
using platform::HttpResponse;

namespace {

constexpr std::chrono::seconds kRequestTimeout{15};
constexpr std::int32_t kLongestMaxAge = 86400;

std::span<const std::uint8_t> bytesOf(std::string_view text) {
  return {reinterpret_cast<const std::uint8_t*>(text.data()), text.size()};
}

// Headers that came more than once count as one, joined by commas.
std::optional<std::string> cacheControlOf(const HttpResponse& response) {
  std::optional<std::string> joined;
  for (const auto& [name, value] : response.headers) {
    if (!platform::equalsIgnoringCase(name, "cache-control")) continue;
    joined = joined ? *joined + ", " + value : value;
  }
  return joined;
}

// The conferencing client's bag when no server can be reached.
SharedDictionary fallbackBag() {
  Dictionary section;
  section.set(kOrvantaBackendBrisk, Dictionary{{"active", true}});
  auto bag = std::make_shared<Dictionary>();
  for (const StorebagKey key : {StorebagKey::bagInternal, StorebagKey::bagDevelopment, StorebagKey::bagRelease}) {
    bag->set(nameOf(key), section);
  }
  bag->set(nameOf(StorebagKey::bagVersion), "1.0.0-Confluo-Fallback");
  bag->set(nameOf(StorebagKey::bagRefreshCycle), 3600);
  return bag;
}

// The bytes of a base64 text under `key`; nullopt when the document has no such text or it does not decode.
std::optional<std::vector<std::uint8_t>> decodedMember(const Dictionary& document, StorebagKey key) {
  const std::string* member = document.text(nameOf(key));
  return member == nullptr ? std::nullopt : platform::decodeBase64(*member);
}

// The inner bag of a downloaded document, once its signature has been verified; null for anything else.
SharedDictionary openDocument(Orvanta& orvanta, std::string_view body) {
  const platform::BlockingScope blocking;  // a document of megabytes takes a while
  const auto document = platform::parsePropertyList(bytesOf(body));
  if (!document) ORVANTA_LOG(error, "fetchStorebagWithName: propertyListWithData error {}", document.error());
  const Dictionary* content = document ? document->dictionary() : nullptr;
  if (content == nullptr || !content->contains(nameOf(StorebagKey::documentSignature))) {
    ORVANTA_LOG(error, "fetchStorebagWithName: Signature is missing");
    return nullptr;
  }
  const auto key = orvanta.publicKey();
  if (!key) return nullptr;
  const auto signature = decodedMember(*content, StorebagKey::documentSignature);
  if (!signature) return nullptr;
  const auto bag = decodedMember(*content, StorebagKey::documentBag);
  if (!bag) return nullptr;
  if (!verifyStorebagSignature(*key, *bag, *signature)) {
    ORVANTA_LOG(error, "fetchStorebagWithName: Signature can not be verified, {}", fmt::ptr(key.get()));
    return nullptr;
  }
  auto inner = platform::parsePropertyList(*bag);
  if (!inner || inner->dictionary() == nullptr) return nullptr;
  return std::make_shared<const Dictionary>(std::move(*inner->dictionary()));
}

}  // namespace

std::optional<std::string> userDefaultStringForKey(Platform& platform, std::string_view key) {
  return platform.defaults().text(key);
}

bool verifyStorebagSignature(const platform::RsaPublicKey& key, std::span<const std::uint8_t> bag,
                             std::span<const std::uint8_t> signature) {
  return key.verifySha1(platform::sha1(bag), signature);
}

std::int32_t maxAgeFromCacheControl(std::optional<std::string_view> cacheControl) {
  if (!cacheControl) return kLongestMaxAge;
  std::string_view rest = *cacheControl;
  bool previousIsMaxAge = false;
  while (true) {
    const std::size_t end = rest.find_first_of("= ");
    const std::string_view piece = rest.substr(0, end);
    if (previousIsMaxAge) {
      const long long number = std::strtoll(std::string(piece).c_str(), nullptr, 10);
      using Limits = std::numeric_limits<std::int32_t>;
      return static_cast<std::int32_t>(std::clamp<long long>(number, Limits::min(), Limits::max()));
    }
    if (end == std::string_view::npos) return kLongestMaxAge;
    previousIsMaxAge = piece == "max-age";
    rest.remove_prefix(end + 1);
  }
}

SharedDictionary fetchStorebagWithName(ConfigServices& services, const std::string& name, StorebagFetch& fetch) {
  platform::HttpRequest request;
  request.url = services.storebagServerURL() + "/" + name + "?version=" + services.orvanta().bundleVersion();
  request.timeout = kRequestTimeout;
  const std::string url = request.url;
  ORVANTA_LOG(debug, "fetchStorebagWithName: Storebag Server URL: {}", url);
  if (fetch.lastModified) {
    ORVANTA_LOG(debug, "fetchStorebagWithName: Adding 'Last-Modified: {}' to the header", *fetch.lastModified);
    request.headers.push_back({"If-Modified-Since", *fetch.lastModified});
  }
  const platform::HttpResult result = services.platform().http().perform(services.storebagLane(), std::move(request));
  if (!result.response) {
    ORVANTA_LOG(info, "fetchStorebagWithName: Error resolving with lookup server {}, sendSynchronousRequest error {}",
                url, result.error);
    if (name != kConfluoStorebag) return nullptr;
    ORVANTA_LOG(info, "fetchStorebagWithName: Loading default storebag '{}'", name);
    return fallbackBag();
  }
  const HttpResponse& response = *result.response;
  fetch.maxAge = maxAgeFromCacheControl(cacheControlOf(response));
  if (const std::string* stamp = response.header("Last-Modified")) {
    if (response.body.empty() && fetch.lastModified) {
      ORVANTA_LOG(debug, "fetchStorebagWithName: storebag content has not changed. using its cached version");
      fetch.notModified = true;
      return nullptr;
    }
    fetch.lastModified = *stamp;
    ORVANTA_LOG(debug, "fetchStorebagWithName: New 'Last-Modified: {}' received", *stamp);
  }
  return openDocument(services.orvanta(), response.body);
}

SharedDictionary fetchStorebagForEnvironmentAndClientType(ConfigServices& services, std::int32_t clientType,
                                                          StorebagFetch& fetch) {
  const auto name = storebagNameForClientType(clientType);
  if (!name) {
    ORVANTA_LOG(error, "fetchStorebagForEnvironmentAndClientType: Could not find storebag name for client type {}",
                clientType);
    return nullptr;
  }
  const SharedDictionary bag = fetchStorebagWithName(services, std::string(*name), fetch);
  if (!bag) {
    if (!fetch.notModified) {
      ORVANTA_LOG(error, "fetchStorebagForEnvironmentAndClientType: Could not fetch storebag for client type {}",
                  clientType);
    }
    return nullptr;
  }
  const EnvironmentType environment = services.currentEnvironmentType();
  // An environment without a name has no section, whatever the bag holds.
  const auto sectionNamed = [&](std::string_view name) { return name.empty() ? nullptr : bag->dictionary(name); };
  std::string_view sectionName = environmentSectionName(environment);
  const Dictionary* section = sectionNamed(sectionName);
  if (section == nullptr && environment == EnvironmentType::seed) {
    ORVANTA_LOG(warning, "fetchStorebagForEnvironmentAndClientType: Seed section is missing in the storebag.");
    sectionName = environmentSectionName(EnvironmentType::release);
    section = sectionNamed(sectionName);
  }
  if (section == nullptr) {
    ORVANTA_LOG(error,
                "fetchStorebagForEnvironmentAndClientType: Could not find storebag for client type {} with {} "
                "environment",
                clientType, sectionName.empty() ? "(null)" : sectionName);
    return nullptr;
  }
  const Value* version = bag->find(nameOf(StorebagKey::bagVersion));
  fetch.version = version == nullptr ? std::string() : version->description();
  if (const Value* refreshCycle = bag->find(nameOf(StorebagKey::bagRefreshCycle))) {
    constexpr std::int64_t kLowest = std::numeric_limits<std::int32_t>::min();
    fetch.maxAge =
        static_cast<std::int32_t>(std::clamp<std::int64_t>(refreshCycle->integerValue(), kLowest, kLongestMaxAge));
    ORVANTA_LOG(info, "fetchStorebagForEnvironmentAndClientType: Store bag override MaxAge={}", fetch.maxAge);
  }
  // A copy, so that the other environments' sections do not stay in memory with it.
  return std::make_shared<const Dictionary>(*section);
}

}  // namespace orvanta
