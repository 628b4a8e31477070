#pragma once

#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "daemon/OrvantadAgent.h"
#include "session/OrvantadSession.h"
#include "tests/support/LogCapture.h"
#include "tests/support/RecordingConnection.h"
#include "tests/support/TestPlatform.h"

namespace orvanta::test {

inline SharedDictionary shared(Dictionary dictionary) {
  return std::make_shared<const Dictionary>(std::move(dictionary));
}

// Keeps what a reply was given.
template <class... Values>
struct Kept {
  std::shared_ptr<std::optional<ReplyOutcome<Values...>>> outcome =
      std::make_shared<std::optional<ReplyOutcome<Values...>>>();
  Reply<Values...> reply() {
    return Reply<Values...>([outcome = outcome](ReplyOutcome<Values...> given) {
      EXPECT_FALSE(outcome->has_value()) << "a reply was given twice";
      *outcome = std::move(given);
    });
  }
  bool given() const { return outcome->has_value() && (*outcome)->values.has_value(); }
  template <std::size_t I = 0>
  const auto& get() const {
    return std::get<I>(*(*outcome)->values);
  }
  std::string error() const { return outcome->has_value() ? (*outcome)->error.text : std::string("no answer"); }
};
using KeptText = Kept<std::optional<std::string>>;
using KeptFlush = Kept<std::optional<std::string>, std::optional<OrvantaError>>;

// The real agent and real sessions on a test device; the storebag comes from the test.
class SessionFixture : public ::testing::Test {
 protected:
  ~SessionFixture() override {
    for (const auto& session : _sessions) leave(session);
  }

  std::shared_ptr<OrvantadSession> makeSession() {
    connections.push_back(std::make_shared<RecordingConnection>(device.get().pool()));
    _sessions.push_back(OrvantadSession::create(device, agent, connections.back()));
    return _sessions.back();
  }
  void leave(const std::shared_ptr<OrvantadSession>& session) {
    agent.invalidated(session);
    session->end();
  }
  // Client type 5 unless `info` says otherwise.
  void configure(OrvantadSession& session, std::uint32_t id, Dictionary info = {}, SharedDictionary userInfo = nullptr,
                 bool aggregates = false) {
    if (!info.contains("sessionID")) info.set("sessionID", id);
    if (!info.contains("clientType")) info.set("clientType", 5);
    session.setSessionInfo(shared(std::move(info)), std::move(userInfo), nullptr, aggregates, {});
  }
  static Dictionary hierarchy(const std::string& token, std::int64_t level) {
    return Dictionary{{"hierarchyToken", Dictionary{{"tokenID", token}, {"level", level}}}};
  }
  std::optional<std::vector<std::string>> start(OrvantadSession& session) {
    Kept<BackendNames> kept;
    session.startConfigWithCompletionHandler(kept.reply());
    return kept.given() ? kept.get() : std::nullopt;
  }
  std::optional<std::string> send(OrvantadSession& session, Dictionary parameters) {
    KeptText kept;
    session.sendMessageWithDictionary(shared(std::move(parameters)), kept.reply());
    EXPECT_TRUE(kept.given());
    return kept.get();
  }

  LogCapture log;
  TestServices<DaemonServices> device;
  SharedDictionary storebag;  // what the server gives; null: nothing
  std::int32_t maxAge = 3600;
  int fetches = 0;
  std::function<void()> whileFetching;  // with the agent's lock held; may be empty
  OrvantadAgent agent{device, [this](std::int32_t, StorebagFetch& fetch) {
                        ++fetches;
                        if (whileFetching) whileFetching();
                        fetch.maxAge = maxAge;
                        fetch.version = "1.0";
                        return storebag;
                      }};
  std::vector<std::shared_ptr<RecordingConnection>> connections;

 private:
  std::vector<std::shared_ptr<OrvantadSession>> _sessions;
};

}  // namespace orvanta::test
