#include "client/Records.h"

#include <memory>
#include <utility>

#include "interface/OrvantaConstants.h"

namespace orvanta {

SharedDictionary SessionInfo::dictionary() const {
  Dictionary record;
  record.set(kOrvantaSessionInfoSessionID, sessionID);
  record.set(kOrvantaSessionInfoClientType, clientType);
  record.set(kOrvantaSessionInfoClientVersion, clientVersion);
  record.set(kOrvantaSessionInfoRequireUserInfo, requireUserInfo);
  record.set(kOrvantaSessionInfoBatchEvent, batchEvent);
  if (hierarchyToken) {
    Dictionary token;
    token.set(kOrvantaHierarchyTokenTokenID, hierarchyToken->tokenID);
    token.set(kOrvantaHierarchyTokenLevel, hierarchyToken->level);
    record.set(kOrvantaSessionInfoHierarchyToken, std::move(token));
  }
  return std::make_shared<const Dictionary>(std::move(record));
}

SharedDictionary UserInfo::dictionary() const {
  Dictionary record = others;
  if (clientName) record.set(kOrvantaUserInfoClientName, *clientName);
  if (serviceName) record.set(kOrvantaUserInfoServiceName, *serviceName);
  return std::make_shared<const Dictionary>(std::move(record));
}

SharedDictionary MessageParameters::dictionary() const {
  Dictionary record;
  record.set(kOrvantaMessageParametersCategory, category);
  record.set(kOrvantaMessageParametersType, type);
  if (payload) record.set(kOrvantaMessageParametersPayload, *payload);
  const std::uint32_t bits = flag | (realtime ? kMessageFlagRealtime : 0) | (promote ? kMessageFlagPromote : 0);
  if (bits != 0) record.set(kOrvantaMessageParametersFlag, bits);
  return std::make_shared<const Dictionary>(std::move(record));
}

}  // namespace orvanta
