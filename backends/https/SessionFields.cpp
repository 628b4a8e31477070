#include "backends/https/SessionFields.h"

#include "backends/https/EventField.h"
#include "config/ClientTypes.h"
#include "config/Conversions.h"

namespace orvanta {
namespace {

// These client types are told apart by the number that the client gave its session.
bool reportsNumericSessionID(std::int32_t clientType, bool isInternal) {
  return clientType == kClientTypeXF || (isInternal && (clientType == kClientTypeZJ || clientType == kClientTypeZEPHQ));
}

Value valueOrNull(const std::optional<std::string>& text) {
  return text ? Value(*text) : Value();
}

}  // namespace

std::shared_ptr<const SessionFields> SessionFields::of(const BackendIdentity& identity, bool internalBuild) {
  auto fields = std::make_shared<SessionFields>();
  fields->startTimeStamp = timevalToSeconds(identity.startTimestamp);
  fields->startTS = roundDownToMinute(static_cast<std::int32_t>(fields->startTimeStamp));
  fields->sender = senderCodeForClientType(identity.clientType);
  fields->clientVersion = identity.clientVersion;
  fields->productFamily = identity.productFamily;
  fields->productModel = identity.productType;
  fields->osVersion = identity.productVersion;
  fields->build = identity.buildVersion;
  fields->internal = internalBuild ? 3 : 2;
  fields->reportVers = identity.selfVersion.text();
  if (reportsNumericSessionID(identity.clientType, identity.isInternal)) fields->numericSessionID = identity.sessionID;

  FieldWriter writer(fields->json, FieldWriter::Form::compact);
  for (std::size_t i = 0; i <= static_cast<std::size_t>(ReservedKey::reportVers); ++i) {
    const auto key = static_cast<ReservedKey>(i);
    const Value value = fields->value(key);
    if (value.isNull()) continue;
    fields->present |= setOf(key);
    writer.value(nameOf(key), value);
  }
  fields->json.erase(0, 1);  // the brace
  return fields;
}

Value SessionFields::value(ReservedKey key) const {
  switch (key) {
    case ReservedKey::startTS:
      return startTS;
    case ReservedKey::sender:
      return sender;
    case ReservedKey::clientVersion:
      return static_cast<int>(clientVersion);
    case ReservedKey::productFamily:
      return productFamily;
    case ReservedKey::productModel:
      return valueOrNull(productModel);
    case ReservedKey::osVersion:
      return valueOrNull(osVersion);
    case ReservedKey::build:
      return valueOrNull(build);
    case ReservedKey::internal:
      return internal;
    case ReservedKey::reportVers:
      return reportVers;
    default:
      return nullptr;
  }
}

double SessionFields::clientTS(platform::TimeValue eventTime) const {
  return sanitizeDouble(static_cast<double>(startTS) + (timevalToSeconds(eventTime) - startTimeStamp));
}

}  // namespace orvanta
