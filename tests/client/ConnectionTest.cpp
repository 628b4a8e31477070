// How a connection begins, how it ends, and what the program hears of it.

#include <atomic>
#include <vector>

#include "interface/WireLimits.h"
#include "tests/client/ClientFixture.h"

namespace orvanta::test {
namespace {

using Connection = ClientFixture;

TEST(Connecting, saysThatNoDaemonIsThere) {
  TemporaryDirectory empty;
  const auto missing = OrvantaConnection::connect({.socketDirectory = empty.path()});
  ASSERT_FALSE(missing);
  EXPECT_EQ(missing.error().kind, CallErrorKind::noSuchService);
  EXPECT_NE(missing.error().text.find(empty.path()), std::string::npos);

  ScriptedDaemon killed;
  killed.stopListening();
  const auto stale = OrvantaConnection::connect({.socketDirectory = killed.directory()});
  ASSERT_FALSE(stale);
  EXPECT_EQ(stale.error().kind, CallErrorKind::noSuchService);

  EXPECT_FALSE(OrvantaConnection::connect({.socketDirectory = std::string(200, 'd')}));
}

TEST_F(Connection, lostMidCallFailsAllThatWaitThenTellsTheHandler) {
  exchangeOneCall();
  std::promise<std::vector<std::string>> told;
  std::vector<std::string> order;  // on the callback thread only
  connection->setConnectionLostHandler([&](const CallError& error) {
    order.push_back("lost");
    EXPECT_EQ(error.kind, CallErrorKind::connectionLost);
    told.set_value(order);
  });
  for (int i = 0; i < 3; ++i) {
    session().sendMessageWithCategory(0, 0, nullptr, StringReply([&order, i](StringReply::Outcome outcome) {
                                        EXPECT_EQ(outcome.error.kind, CallErrorKind::connectionLost);
                                        order.push_back(std::to_string(i));
                                      }));
  }
  peer->next();
  peer->close();
  auto future = told.get_future();
  EXPECT_EQ(within(future), (std::vector<std::string>{"0", "1", "2", "lost"}));

  EXPECT_FALSE(connection->isOpen());
  EXPECT_EQ(session().blocking().fetchDisplayURL().error().kind, CallErrorKind::connectionLost);
  std::promise<void> late;
  connection->setConnectionLostHandler([&](const CallError&) { late.set_value(); });
  auto again = late.get_future();
  within(again);
}

TEST_F(Connection, endsWhenTheDaemonWillSayNothingMore) {
  Awaited<StringReply> reply;
  session().fetchDisplayURL(reply.reply());
  peer->next();
  peer->shutdownSending();
  EXPECT_FALSE(reply.get().values);
  EXPECT_FALSE(peer->nextFrame());
}

TEST_F(Connection, endsOverWhatIsNoFrame) {
  Awaited<StringReply> answered, failed;
  session().fetchDisplayURL(answered.reply());
  session().fetchDisplayURL(failed.reply());
  const Frame first = peer->next();
  peer->next();
  peer->answer(first, {"whole"});
  peer->write({0xc1, 0xff, 0x00});
  EXPECT_EQ(textOf(answered.get()), "whole");
  const auto outcome = failed.get();
  EXPECT_EQ(outcome.error.kind, CallErrorKind::connectionLost);
  EXPECT_NE(outcome.error.text.find("broke the protocol"), std::string::npos);
}

TEST_F(Connection, destroyedFailsWhatWaitsAndCallsNothingAfterwards) {
  std::atomic<int> failed = 0;
  std::atomic<bool> gone = false, calledLate = false;
  connection->setConnectionLostHandler([&](const CallError&) { calledLate = true; });
  for (int i = 0; i < 100; ++i) {
    session().sendMessageWithCategory(0, 0, nullptr, StringReply([&](StringReply::Outcome outcome) {
                                        if (gone) calledLate = true;
                                        if (outcome.error.kind == CallErrorKind::connectionLost) ++failed;
                                      }));
  }
  connection.reset();
  gone = true;
  EXPECT_EQ(failed, 100);
  EXPECT_FALSE(calledLate);
}

TEST_F(Connection, mayBeDestroyedInItsOwnCallbackOrLostHandler) {
  exchangeOneCall();
  Awaited<StringReply> pending;
  std::promise<void> destroyed;
  session().finishSessionWithReply(StringReply([&](StringReply::Outcome) {
    connection.reset();
    destroyed.set_value();
  }));
  session().fetchDisplayURL(pending.reply());
  const Frame finish = peer->next();
  peer->next();
  peer->answer(finish, {nullptr});
  auto done = destroyed.get_future();
  within(done);
  EXPECT_EQ(pending.get().error.kind, CallErrorKind::connectionLost);
  EXPECT_FALSE(peer->nextFrame());

  connect();
  std::promise<void> lost;
  connection->setConnectionLostHandler([&](const CallError&) {
    connection.reset();
    lost.set_value();
  });
  peer->close();
  done = lost.get_future();
  within(done);
}

TEST_F(Connection, closingLetsWhatWasSentGoOut) {
  const auto payload = shared({{"text", std::string(100'000, 'x')}});
  for (int i = 0; i < 30; ++i) session().sendMessageWithCategory(1, 1, payload, {});
  auto closed = std::async(std::launch::async, [this] { connection.reset(); });
  int arrived = 0;
  while (peer->nextFrame()) ++arrived;
  EXPECT_EQ(arrived, 30);
  within(closed);
}

class SlowDaemon : public ClientFixture {
 protected:
  static constexpr std::size_t kLimit = 1U << 20U;
  SlowDaemon() : ClientFixture({.maximumWaitingBytes = kLimit, .closingTime = std::chrono::milliseconds(0)}) {}
  void TearDown() override { connection.reset(); }

  // Calls until one is turned away; how many were taken.
  int callUntilTurnedAway() {
    const auto payload = shared({{"text", std::string(100'000, 'x')}});
    for (int taken = 0; taken < 1000; ++taken) {
      session().sendMessageWithCategory(1, 1, payload, StringReply([this](StringReply::Outcome outcome) {
                                          if (outcome.error.kind == CallErrorKind::tooMuchWaiting) _turnedAway = true;
                                        }));
      // Fails behind the other on the callback thread.
      Awaited<UploadReply> barrier;
      session().uploadFileAtPath(std::string("/nonexistent/file"), barrier.reply());
      barrier.get();
      if (_turnedAway) return taken;
    }
    throw std::runtime_error("there is no limit");
  }

 private:
  std::atomic<bool> _turnedAway = false;
};

TEST_F(SlowDaemon, makesCallsFailRatherThanPileUpAndThoseThatWaitWaitLonger) {
  const int taken = callUntilTurnedAway();
  EXPECT_LT(taken, 40);
  auto answer = std::async(std::launch::async, [this] { return session().blocking().fetchDisplayURL(); });
  for (int i = 0; i < taken; ++i) peer->expect("sendMessageWithCategory");
  peer->answer(peer->expect("fetchDisplayURL"), {"URL"});
  EXPECT_EQ(within(answer).value(), "URL");
}

TEST_F(SlowDaemon, doesNotHoldUpThoseWhoWaitOnceItIsGone) {
  callUntilTurnedAway();
  auto answer = std::async(std::launch::async, [this] { return session().blocking().fetchDisplayURL(); });
  peer->close();
  EXPECT_FALSE(within(answer));
}

// Answers that pile up unread on one side and calls on the other must not wait for each other for ever.
TEST_F(Connection, readsAnswersWhileItsOwnCallsWaitToBeRead) {
  const auto payload = shared({{"text", std::string(100'000, 'x')}});
  Awaited<StringReply> first;
  session().fetchDisplayURL(first.reply());
  const Frame call = peer->next();
  for (int i = 0; i < 40; ++i) session().sendMessageWithCategory(1, 1, payload, {});
  peer->answer(call, {"in between"});
  EXPECT_EQ(textOf(first.get()), "in between");
  for (int i = 0; i < 40; ++i) peer->expect("sendMessageWithCategory");
}

TEST(SharedThread, bringsTheCallbacksOfSeveralConnections) {
  auto thread = CallbackThread::start();
  ASSERT_TRUE(thread);
  ScriptedDaemon daemon;
  auto one = OrvantaConnection::connect({.socketDirectory = daemon.directory(), .callbackThread = *thread});
  auto two = OrvantaConnection::connect({.socketDirectory = daemon.directory(), .callbackThread = *thread});
  ASSERT_TRUE(one && two);
  auto peerOne = daemon.accept();
  auto peerTwo = daemon.accept();
  std::promise<std::thread::id> ids[2];
  (*one)->session().fetchDisplayURL(
      StringReply([&](StringReply::Outcome) { ids[0].set_value(std::this_thread::get_id()); }));
  (*two)->session().fetchDisplayURL(StringReply([&](StringReply::Outcome) {
    // Waiting for the other connection's answer on the thread that must bring it.
    EXPECT_EQ((*one)->session().blocking().startConfig().error().kind, CallErrorKind::wrongThread);
    ids[1].set_value(std::this_thread::get_id());
  }));
  peerOne.answer(peerOne.next(), {"URL"});
  peerTwo.answer(peerTwo.next(), {"URL"});
  auto first = ids[0].get_future(), second = ids[1].get_future();
  EXPECT_EQ(within(first), within(second));
  // One goes; the thread serves the other.
  one->reset();
  auto answer = std::async(std::launch::async, [&] { return (*two)->session().blocking().finishSession(); });
  peerTwo.answer(peerTwo.next(), {"finished"});
  EXPECT_EQ(within(answer).value(), "finished");
}

TEST_F(Connection, bringsEachAnswerOnceUnderStress) {
  constexpr int kThreads = 4, kCalls = 500;
  std::atomic<int> answered = 0, wrong = 0;
  std::thread server([this] {
    while (auto frame = peer->nextFrame()) {
      if (frame->kind == Frame::Kind::request) peer->answer(*frame, {std::to_string(frame->params[0].integerValue())});
    }
  });
  std::vector<std::thread> callers;
  for (int t = 0; t < kThreads; ++t) {
    callers.emplace_back([&, t] {
      for (int i = 0; i < kCalls; ++i) {
        const auto number = static_cast<std::uint16_t>(t * kCalls + i);
        session().sendMessageWithCategory(number, 0, nullptr, StringReply([&, number](StringReply::Outcome outcome) {
                                            if (textOf(outcome) != std::to_string(number)) ++wrong;
                                            ++answered;
                                          }));
      }
    });
  }
  for (auto& caller : callers) caller.join();
  // Behind all others on the wire.
  EXPECT_TRUE(session().blocking().sendMessage(0, 0, nullptr));
  connection.reset();
  server.join();
  EXPECT_EQ(answered, kThreads * kCalls);
  EXPECT_EQ(wrong, 0);
}

}  // namespace
}  // namespace orvanta::test
