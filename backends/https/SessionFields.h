#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "backends/BackendSetup.h"
#include "backends/https/ReservedKeys.h"
#include "interface/Values.h"

namespace orvanta {

// The reserved fields that are the same in every event of a session, and their JSON, written once. Immutable; shared by
// the records of the session, which outlive their backend only in tests.
struct SessionFields {
  static std::shared_ptr<const SessionFields> of(const BackendIdentity& identity, bool internalBuild);

  std::int64_t startTS = 0;  // whole minutes
  std::string sender;
  std::uint16_t clientVersion = 0;
  std::string productFamily;
  std::optional<std::string> productModel;
  std::optional<std::string> osVersion;
  std::optional<std::string> build;
  std::int64_t internal = 2;
  std::string reportVers;

  // Replaces the combined identifier in the sessions of some client types.
  std::optional<std::uint32_t> numericSessionID;
  double startTimeStamp = 0;

  ReservedKeys present = 0;  // of the constant ones
  std::string json;          // compact, a comma behind each field

  // The constant field's value; null when it is absent or not one of them.
  Value value(ReservedKey key) const;
  // startTS + (event time - session start): all events of a session share one minute-aligned origin.
  double clientTS(platform::TimeValue eventTime) const;
};

}  // namespace orvanta
