#include "tools/orvantactl/ClientOptions.h"

#include <fmt/format.h>

#include <atomic>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <utility>

#include "tools/orvantactl/ExitStatus.h"
#include "tools/orvantactl/JsonValues.h"

namespace orvanta::ctl {

namespace {
// The errno of the first line that was not taken. Lines come from the library's thread, too.
std::atomic<int> gOutputError{0};
}  // namespace

void ClientOptions::addConnectionTo(CLI::App& command) {
  command
      .add_option("--socket-dir", socketDirectory,
                  "Directory of the daemon's socket; default: $RUNTIME_DIRECTORY, else /run/orvanta")
      ->type_name("DIR");
}

void ClientOptions::addSessionTo(CLI::App& command) {
  command
      .add_option("--client-type", clientType,
                  "Whom the session reports for; selects the storebag (types 5 to 18 have one)")
      ->required()
      ->type_name("N");
  command.add_option("--session-id", sessionID, "The client's own number for the session; default: 1")->type_name("N");
  command.add_option("--client-version", clientVersion, "The client's version; default: 0")->type_name("N");
  command.add_flag("--batch", batch, "Ask that events be gathered and sent together");
  command.add_flag("--require-user-info", requireUserInfo,
                   "Promise user info: the session reports once it is known (--client-name, --service-name)");
}

void ClientOptions::addUserInfoTo(CLI::App& command) {
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
    if (!parsed) return Failure{"--user-info is no JSON: " + parsed.error()};
    auto* others = parsed->dictionary();
    if (others == nullptr) return Failure{"--user-info must be a JSON object such as '{\"region\": \"north\"}'"};
    info.others = std::move(*others);
  }
  return std::optional<UserInfo>(std::move(info));
}

std::unique_ptr<OrvantaConnection> connectOrComplain(const ClientOptions& options, int& status) {
  ConnectionOptions connection;
  connection.socketDirectory = options.socketDirectory;
  auto connected = OrvantaConnection::connect(std::move(connection));
  if (connected) return std::move(*connected);
  status = complain(connected.error());
  return nullptr;
}

void complain(const std::string& text) {
  // Without exceptions: that nobody takes complaints is no reason to abort.
  const auto line = fmt::format("orvantactl: {}\n", text);
  std::fwrite(line.data(), 1, line.size(), stderr);
}

int complain(const CallError& error) {
  complain(error.text);
  return exitStatusFor(error);
}

bool printLine(const std::string& line) {
  std::fwrite(line.data(), 1, line.size(), stdout);
  std::fputc('\n', stdout);
  if (std::fflush(stdout) == 0 && std::ferror(stdout) == 0) return true;
  int none = 0;
  gOutputError.compare_exchange_strong(none, errno);
  return false;
}

int statusAfterOutput(int status) {
  // The stream remembers a failure, but not its reason.
  if (std::fflush(stdout) == 0 && std::ferror(stdout) == 0) return status;
  const int code = gOutputError != 0 ? gOutputError.load() : errno;
  complain(fmt::format("standard output did not take everything: {}", std::strerror(code)));
  return status == kAllTaken ? kOutputLost : status;
}

}  // namespace orvanta::ctl
