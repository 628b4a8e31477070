#pragma once

#include <memory>
#include <optional>

#include "client/OrvantaConnection.h"
#include "tools/orvantactl/ClientOptions.h"

namespace orvanta::ctl {

// The ways from options to a session, for every command. Each says on standard error why it fails, and sets `status`
// then.

// The two records that the options describe. Fails with kUsage.
struct SessionRecords {
  SessionInfo sessionInfo;
  std::optional<UserInfo> userInfo;

  SharedDictionary userInfoDictionary() const { return userInfo ? userInfo->dictionary() : nullptr; }
};
std::optional<SessionRecords> recordsOrComplain(const ClientOptions& options, int& status);

// Null when it fails.
std::unique_ptr<OrvantaConnection> connectOrComplain(const ClientOptions& options, int& status);

// A connection whose session has been set up, as most commands want it.
struct ConfiguredSession {
  std::unique_ptr<OrvantaConnection> connection;  // null when it failed
  BackendNames backends;  // nullopt also when the daemon has no storebag for the client type: kSomethingNotTaken
};
ConfiguredSession configureOrComplain(const ClientOptions& options, int& status);

}  // namespace orvanta::ctl
