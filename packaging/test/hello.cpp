// Reports one event of the category that it is given, as a program would that is built against the installed library.
#include <orvanta/client/OrvantaClient.h>

#include <cstdlib>
#include <iostream>

int main(int count, char** arguments) {
  const int category = count > 1 ? std::atoi(arguments[1]) : 1;
  auto connected = orvanta::OrvantaConnection::connect();
  if (!connected) return std::cerr << connected.error().text << '\n', 1;
  auto calls = (*connected)->session().blocking();
  const auto backends = calls.configure({.sessionID = 7, .clientType = 5});
  if (!backends) return std::cerr << backends.error().text << '\n', 1;
  if (!*backends) return std::cerr << "the daemon has no storebag\n", 1;
  const auto taken = calls.sendMessage(
      {.category = static_cast<std::uint16_t>(category), .type = 1, .payload = {{{"greeting", "hello"}}}});
  if (!taken) return std::cerr << taken.error().text << '\n', 1;
  calls.finishSession();
  return calls.flushMessages() ? 0 : 1;
}
