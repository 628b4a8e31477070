// Reports one event of the category that it is given, as a program would that is built against the installed library.
// It has a platform/Value.h and a namespace platform of its own, which the library's headers and symbols leave alone.
#include "platform/Value.h"

#include <orvanta/client/OrvantaClient.h>

#include <cstdlib>
#include <iostream>

int main(int count, char** arguments) {
  const auto complain = [](const orvanta::CallError& error) { return std::cerr << error.text << '\n', 1; };
  const platform::Value category{count > 1 ? std::atoi(arguments[1]) : 1};
  auto connected = orvanta::OrvantaConnection::connect();
  if (!connected) return complain(connected.error());
  auto calls = (*connected)->session().blocking();
  const auto backends = calls.configure({.sessionID = 7, .clientType = 5});
  if (!backends) return complain(backends.error());
  if (!*backends) return std::cerr << "the daemon has no storebag\n", 1;
  const auto taken = calls.sendMessage({.category = static_cast<std::uint16_t>(category.number),
                                        .type = 1,
                                        .payload = {{{"greeting", platform::describe(category)}}}});
  if (!taken) return complain(taken.error());
  if (const auto finished = calls.finishSession(); !finished) return complain(finished.error());
  const auto flushed = calls.flushMessages();
  return flushed ? 0 : complain(flushed.error());
}
