// Reports one event and waits until it has been sent. Prints what the daemon answered.
#include <orvanta/client/OrvantaClient.h>

#include <iostream>

int main() {
  auto connected = orvanta::OrvantaConnection::connect();
  if (!connected) return std::cerr << connected.error().text << '\n', 1;
  auto calls = (*connected)->session().blocking();

  const auto backends = calls.configure({.sessionID = 1, .clientType = 7});
  if (!backends) return std::cerr << backends.error().text << '\n', 1;
  if (!*backends) return std::cerr << "the daemon has no storebag for client type 7\n", 1;

  const auto reply = calls.sendMessage({.category = 1, .type = 2, .payload = {{{"duration", 1.5}}}});
  if (!reply) return std::cerr << reply.error().text << '\n', 1;
  std::cout << reply->value_or("(taken)") << '\n';

  if (const auto finished = calls.finishSession(); !finished) return std::cerr << finished.error().text << '\n', 1;
  const auto flushed = calls.flushMessages();
  if (!flushed) return std::cerr << flushed.error().text << '\n', 1;
  // An event that was sent at once leaves nothing to flush, and the daemon says so as an error of its own.
  if (flushed->error) std::cerr << flushed->error->description << '\n';
}
