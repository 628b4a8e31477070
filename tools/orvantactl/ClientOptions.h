#pragma once

#include <CLI/CLI.hpp>
#include <cstdint>
#include <optional>
#include <string>

#include "client/Records.h"
#include "interface/Values.h"

namespace orvanta::ctl {

// The options that several commands share: which daemon they connect to, and which session they report in. Filled in by
// the command line's parser, which must not outlive it.
struct ClientOptions {
  std::string socketDirectory;
  std::int32_t clientType = 0;
  std::uint32_t sessionID = 1;
  std::int32_t clientVersion = 0;
  bool batch = false;
  bool requireUserInfo = false;
  std::string clientName;
  std::string serviceName;
  std::string userInfoJson;
  std::string hierarchyToken;
  std::uint32_t level = 0;

  // The socket's directory, the session and its user info.
  void addTo(CLI::App& command);
  // The group of sessions; `tokenOption` is what the command calls it.
  void addHierarchyTo(CLI::App& command, const std::string& tokenOption);

  SessionInfo sessionInfo() const;
  // Returns nullopt when no option gives any. Fails when --user-info is not a JSON object.
  Result<std::optional<UserInfo>> userInfo() const;
};

}  // namespace orvanta::ctl
