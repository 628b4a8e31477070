#include "tools/orvantactl/ClientOptions.h"

#include <utility>

#include "tools/orvantactl/JsonValues.h"

namespace orvanta::ctl {

void ClientOptions::addTo(CLI::App& command) {
  command
      .add_option("--socket-dir", socketDirectory,
                  "Directory of the daemon's socket; default: $RUNTIME_DIRECTORY, else /run/orvanta")
      ->type_name("DIR");
  command
      .add_option("--client-type", clientType,
                  "The type of client that the session reports for; selects the storebag (types 5 to 18 have one)")
      ->required()
      ->type_name("N");
  command.add_option("--session-id", sessionID, "The client's own number for the session; default: 1")->type_name("N");
  command.add_option("--client-version", clientVersion, "The client's version; default: 0")->type_name("N");
  command.add_flag("--batch", batch, "Ask that events be gathered and sent together");
  command.add_flag("--require-user-info", requireUserInfo,
                   "Promise user info: the session reports once it is known (--client-name, --service-name)");
  command.add_option("--client-name", clientName, "User info: name of the client")->type_name("S");
  command.add_option("--service-name", serviceName, "User info: name of its service")->type_name("S");
  command
      .add_option("--user-info", userInfoJson,
                  "User info: further entries, merged into the events, such as '{\"region\": \"north\"}'")
      ->type_name("JSON");
}

void ClientOptions::addHierarchyTo(CLI::App& command, const std::string& tokenOption) {
  auto* token =
      command.add_option(tokenOption, hierarchyToken, "Name of the group of sessions that this one belongs to")
          ->type_name("T");
  command.add_option("--level", level, "Depth of the session in its group; default: 0, the root")
      ->type_name("N")
      ->needs(token);
}

SessionInfo ClientOptions::sessionInfo() const {
  SessionInfo info;
  info.sessionID = sessionID;
  info.clientType = clientType;
  info.clientVersion = clientVersion;
  info.requireUserInfo = requireUserInfo;
  info.batchEvent = batch;
  if (!hierarchyToken.empty()) info.hierarchyToken = HierarchyToken{hierarchyToken, level};
  return info;
}

Result<std::optional<UserInfo>> ClientOptions::userInfo() const {
  if (clientName.empty() && serviceName.empty() && userInfoJson.empty()) return std::optional<UserInfo>();
  UserInfo info;
  if (!clientName.empty()) info.clientName = clientName;
  if (!serviceName.empty()) info.serviceName = serviceName;
  if (!userInfoJson.empty()) {
    auto parsed = parseTaggedJson(userInfoJson);
    if (!parsed) return Failure{"--user-info is not JSON: " + parsed.error()};
    auto* others = parsed->dictionary();
    if (others == nullptr) return Failure{"--user-info must be a JSON object such as '{\"region\": \"north\"}'"};
    info.others = std::move(*others);
  }
  return std::optional<UserInfo>(std::move(info));
}

}  // namespace orvanta::ctl
