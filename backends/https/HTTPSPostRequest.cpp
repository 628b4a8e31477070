// HTTPSPostBackend: what a post carries besides its message.

#include <fmt/format.h>

#include "backends/https/HTTPSPostBackend.h"
#include "config/ClientTypes.h"
#include "interface/OrvantaConstants.h"

namespace orvanta {

std::optional<std::string> userInfoText(const SharedDictionary& userInfo, std::string_view key) {
  const Value* value = userInfo ? userInfo->find(key) : nullptr;
  if (value == nullptr || (value->string() == nullptr && !value->isNumber())) return std::nullopt;
  return value->description();
}

void HTTPSPostBackend::postJSONMessage(std::string json, const Event* event, PostCompletion completion) {
  const bool realtime = event != nullptr && isRealtime(event->flag);
  const std::optional<std::string>& url = realtime ? _postURLs.realtimePostURL() : _postURLs.postURL();
  if (!url) {
    if (completion) completion(makeOrvantaError("postURL is nil", -1));
    return;
  }
  if (!_postQueue) _postQueue = std::make_shared<PostQueue>(services(), weak_from_this(), name());
  _postQueue->post({*url, postHeaders(event), std::move(json), std::move(completion)});
}

std::vector<platform::HttpHeader> HTTPSPostBackend::postHeaders(const Event* event) const {
  const BackendIdentity& facts = identity();
  std::vector<platform::HttpHeader> headers;
  headers.reserve(12);
  if (auto client = userInfoText(userInfoDict(), kOrvantaUserInfoClientName)) {
    headers.push_back({"X-ORV-Client-Name", std::move(*client)});
  }
  if (auto service = userInfoText(userInfoDict(), kOrvantaUserInfoServiceName)) {
    headers.push_back({"X-ORV-Service-Name", std::move(*service)});
  }
  if (facts.isInternal) headers.push_back({"X-ORV-Internal-Build", "1"});
  headers.push_back(
      {"User-Agent", fmt::format("Orvanta/{} ({}; {})", facts.selfVersion.text(), facts.productType.value_or("(null)"),
                                 facts.productVersion.value_or("(null)"))});
  headers.push_back({"X-ORV-Client-Version", std::to_string(facts.clientVersion)});
  headers.push_back({"X-ORV-Sender", std::string(senderCodeForClientType(facts.clientType))});
  if (event != nullptr) {
    headers.push_back({"X-ORV-Event-Map", fmt::format("{} {}", event->category, event->type)});
  }
  headers.push_back({"Accept", "application/json"});
  headers.push_back({"Content-Type", "application/json"});
  return headers;
}

}  // namespace orvanta
