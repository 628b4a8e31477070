#pragma once

#include <CLI/CLI.hpp>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "client/OrvantaConnection.h"
#include "client/Records.h"
#include "interface/Values.h"

namespace orvanta::ctl {

// Options by which several commands say whom they speak to and for whom. Filled in by the command line's parser.
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

  void addConnectionTo(CLI::App& command);
  void addSessionTo(CLI::App& command);
  void addUserInfoTo(CLI::App& command);
  void addHierarchyTo(CLI::App& command, const std::string& tokenOption);

  SessionInfo sessionInfo() const;
  // None when no option gives any. Fails when --user-info is no JSON object.
  Result<std::optional<UserInfo>> userInfo() const;
};

// Connects, or says on standard error why not and sets `status`.
std::unique_ptr<OrvantaConnection> connectOrComplain(const ClientOptions& options, int& status);

// "orvantactl: TEXT" on standard error.
void complain(const std::string& text);
// The same for a call that failed; gives the exit status that follows.
int complain(const CallError& error);
// One line on standard output, written at once. False when standard output does not take it; main says so, by
// statusAfterOutput(), so that callers need to look only where they would go on for nothing.
bool printLine(const std::string& line);
// The exit status after the last output. When some was lost, on whatever way it was written, says so, and does not let
// that pass for success.
int statusAfterOutput(int status);

}  // namespace orvanta::ctl
