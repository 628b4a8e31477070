#include <fmt/format.h>

#include <cstdio>
#include <cstdlib>
#include <iostream>
#include <string>

#include "client/OrvantaClient.h"

// A program of a group: MEMBER ID TOKEN LEVEL aggregates|sends. Joins as the session ID, whose user info holds that
// number as "who"; sends an event for each number that comes on standard input, and leaves at its end. Every line on
// standard error says what has happened; events by other programs are theirs to send, and are told in one write each.

namespace {

void say(const std::string& line) {
  const std::string whole = line + "\n";
  std::fwrite(whole.data(), 1, whole.size(), stderr);
}

std::string entry(const orvanta::SharedDictionary& dictionary, std::string_view key) {
  const auto* value = dictionary ? dictionary->find(key) : nullptr;
  return value == nullptr ? "none" : value->description();
}

}  // namespace

int main(int argumentCount, char** arguments) {
  using namespace orvanta;
  if (argumentCount != 5) return 2;
  const auto id = static_cast<std::uint32_t>(std::strtoul(arguments[1], nullptr, 10));
  const auto level = static_cast<std::uint32_t>(std::strtoul(arguments[3], nullptr, 10));
  auto connection = OrvantaConnection::connect();
  if (!connection) {
    say(connection.error().text);
    return 1;
  }
  auto& session = (*connection)->session();
  if (std::string_view(arguments[4]) == "aggregates") {
    session.setAggregationHandler(
        [](const AggregatedEvent& event) {
          say(fmt::format("received {}/{} marker {} who {} from {}", event.category, event.type,
                          entry(event.payload, "marker"), entry(event.payload, "who"),
                          entry(event.sessionInfo, "sessionID")));
        },
        [] { say("end"); });
  }
  SessionInfo info{.sessionID = id, .clientType = 5, .requireUserInfo = true};
  info.hierarchyToken = HierarchyToken{arguments[2], level};
  const auto configured = session.blocking().configure(info, UserInfo{"client", "service", {{"who", id}}});
  if (!configured) {
    say(configured.error().text);
    return 1;
  }
  say("joined");
  for (std::string number; std::getline(std::cin, number);) {
    MessageParameters event{.category = 20, .type = static_cast<std::uint16_t>(id)};
    event.payload = Dictionary{{"marker", std::atoi(number.c_str())}};
    if (const auto sent = session.blocking().sendMessage(event); !sent) {
      say(sent.error().text);
      return 1;
    }
    say("sent " + number);
  }
  return session.blocking().finishSession() ? 0 : 1;
}
