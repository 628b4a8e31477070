#pragma once

#include <gtest/gtest.h>

#include <chrono>
#include <future>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <thread>
#include <utility>

#include "client/OrvantaClient.h"
#include "interface/Values.h"
#include "tests/support/ScriptedDaemon.h"

namespace orvanta::test {
using platform::Frame;

constexpr std::chrono::seconds kTimeout{30};

template <class T>
T within(std::future<T>& future) {
  if (future.wait_for(kTimeout) != std::future_status::ready) throw std::runtime_error("waited in vain");
  return future.get();
}

// A reply whose outcome the test can wait for.
template <class AnyReply>
class Awaited {
 public:
  using Outcome = typename AnyReply::Outcome;
  AnyReply reply() {
    return AnyReply([promise = &_promise](Outcome outcome) { promise->set_value(std::move(outcome)); });
  }
  Outcome get() { return within(_future); }
  bool isReady() const { return _future.wait_for(std::chrono::seconds(0)) == std::future_status::ready; }

 private:
  std::promise<Outcome> _promise;
  std::future<Outcome> _future = _promise.get_future();
};

// A client connected to a daemon that the test plays.
class ClientFixture : public testing::Test {
 protected:
  explicit ClientFixture(ConnectionOptions options = {}) { connect(std::move(options)); }

  void connect(ConnectionOptions options = {}) {
    options.socketDirectory = daemon.directory();
    auto connected = OrvantaConnection::connect(std::move(options));
    if (!connected) throw std::runtime_error(connected.error().text);
    connection = std::move(*connected);
    peer.emplace(daemon.accept());
  }
  ClientSession& session() { return connection->session(); }
  // Makes one call and answers it, so that the daemon has been heard from.
  void exchangeOneCall() {
    Awaited<StringReply> reply;
    session().fetchDisplayURL(reply.reply());
    peer->answer(peer->expect("fetchDisplayURL"), {"URL"});
    ASSERT_TRUE(reply.get().values);
  }

  ScriptedDaemon daemon;
  std::optional<ScriptedPeer> peer;
  std::unique_ptr<OrvantaConnection> connection;
};

inline std::string textOf(const StringReply::Outcome& outcome) {
  if (!outcome.values) return "error: " + outcome.error.text;
  return std::get<0>(*outcome.values).value_or("(null)");
}

inline SharedDictionary shared(Dictionary dictionary) {
  return std::make_shared<const Dictionary>(std::move(dictionary));
}

}  // namespace orvanta::test
