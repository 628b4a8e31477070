#include "platform/ipc/Connection.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <thread>

#include "tests/platform/ipc/ConnectionFixture.h"
#include "tests/support/LogCapture.h"
#include "tests/support/Threads.h"

namespace orvanta::test {
namespace {

using namespace std::chrono_literals;

using ConnectionTest = ConnectionFixture;

TEST_F(ConnectionTest, CarriesOutEveryWholeFrameThatArrivedBeforeTheClose) {
  LogCapture log;
  Counter entered, closed;
  auto made = open([&](Connection&, Frame& frame) {
    if (frame.method != "first") return;
    entered.add();
    closed.waitFor(1);
  });
  ASSERT_TRUE(made.peer.write(notification("first")));
  ASSERT_TRUE(entered.waitFor(1));
  const Bytes more = notification("more");
  ASSERT_TRUE(made.peer.write(repeated(more, 1000) + Bytes(more.begin(), more.end() - 2)));
  made.peer.close();
  closed.add();
  ASSERT_TRUE(made.delegate->waitForInvalidation());
  EXPECT_EQ(made.delegate->frameCount(), 1001);
  EXPECT_EQ(made.delegate->protocolError(), std::nullopt);
  EXPECT_EQ(made.delegate->interruptions(), 0);
  EXPECT_TRUE(log.lines().empty());
}

TEST_F(ConnectionTest, OutlivesAHalfCloseUntilTheRealOne) {
  auto made = open();
  const std::shared_ptr<Outbox> outbox = made.connection->outbox();
  ASSERT_TRUE(made.peer.write(request(1, "call") + request(2, "call")));
  made.peer.shutdownSending();
  ASSERT_TRUE(made.delegate->waitForInterruption());
  EXPECT_EQ(made.delegate->frameCount(), 2);
  // Answers made later, on other threads, still arrive.
  std::thread([&] { EXPECT_TRUE(outbox->send(response(2, "late"))); }).join();
  EXPECT_TRUE(outbox->send(response(1, "later")));
  const Bytes expected = response(2, "late") + response(1, "later");
  EXPECT_EQ(made.peer.read(expected.size()), expected);
  onQueueOf(*made.connection, [] {});
  EXPECT_EQ(made.delegate->invalidations(), 0);
  made.peer.close();
  ASSERT_TRUE(made.delegate->waitForInvalidation());
  EXPECT_EQ(made.delegate->interruptions(), 1);
  EXPECT_EQ(made.delegate->protocolError(), std::nullopt);
}

TEST_F(ConnectionTest, AFailedWriteAfterAHalfCloseEndsIt) {
  auto made = open();
  made.peer.shutdownSending();
  ASSERT_TRUE(made.delegate->waitForInterruption());
  made.peer.shutdownReceiving();
  made.connection->outbox()->send(response(1, "nobody"));
  EXPECT_TRUE(made.delegate->waitForInvalidation());
}

TEST_F(ConnectionTest, AFailedWriteOnlyStopsWriting) {
  std::vector<bool> sent;
  auto made = open([&](Connection& connection, Frame& frame) {
    sent.push_back(connection.outbox()->send(response(frame.messageID, "nobody reads")));
  });
  made.peer.shutdownReceiving();
  ASSERT_TRUE(made.peer.write(request(1, "a")));
  ASSERT_TRUE(made.delegate->waitForFrames(1));
  onQueueOf(*made.connection, [] {});
  EXPECT_FALSE(made.connection->outbox()->send(response(1, "again")));
  EXPECT_EQ(made.connection->outbox()->pending(), 0U);
  ASSERT_TRUE(made.peer.write(repeated(request(2, "b"), 200)));
  ASSERT_TRUE(made.delegate->waitForFrames(201));
  EXPECT_EQ(made.delegate->invalidations(), 0);
  made.peer.close();
  ASSERT_TRUE(made.delegate->waitForInvalidation());
  EXPECT_FALSE(sent.back());
  EXPECT_TRUE(eventually([&] { return made.connection->outbox()->isClosed(); }));
}

TEST_F(ConnectionTest, GathersTheAnswersOfATurnUntilItBlocks) {
  Counter checked;
  auto made = make();
  made.delegate->onFrame = [&, outbox = std::weak_ptr(made.connection->outbox())](Frame& frame) {
    if (const auto strong = outbox.lock()) strong->send(response(frame.messageID, "x"));
    if (frame.messageID != 2) return;
    EXPECT_FALSE(made.peer.hasBytes());
    const BlockingScope scope;
    EXPECT_TRUE(made.peer.hasBytes());
    checked.add();
  };
  ASSERT_TRUE(made.peer.write(request(1, "a") + request(2, "b") + request(3, "c")));
  made.connection->resume(made.delegate);
  ASSERT_TRUE(checked.waitFor(1));
  const Bytes expected = response(1, "x") + response(2, "x") + response(3, "x");
  EXPECT_EQ(made.peer.read(expected.size()), expected);
}

TEST_F(ConnectionTest, ABusyConnectionLetsOthersHaveTheirTurn) {
  startPool(1);
  std::vector<std::string> order;  // one thread
  auto other = open([&](Connection&, Frame& frame) { order.push_back(frame.method); });
  auto busy = make();
  busy.delegate->onFrame = [&](Frame& frame) {
    if (order.empty()) {
      EXPECT_TRUE(other.peer.write(notification("other")));
    }
    order.push_back(frame.method);
  };
  ASSERT_TRUE(busy.peer.write(repeated(notification("busy"), 1000)));
  busy.connection->resume(busy.delegate);
  ASSERT_TRUE(busy.delegate->waitForFrames(1000));
  ASSERT_TRUE(other.delegate->waitForFrames(1));
  _pool->stop();
  const auto turn = std::find(order.begin(), order.end(), "other") - order.begin();
  EXPECT_LE(turn, 4 * Connection::kFramesPerTurn);
}

TEST_F(ConnectionTest, CancelFromSeveralThreadsEndsItOnce) {
  auto made = open();
  ASSERT_TRUE(made.peer.write(notification("call")));
  inThreads(4, [&](int) { made.connection->cancel(); });
  ASSERT_TRUE(made.delegate->waitForInvalidation());
  EXPECT_TRUE(made.peer.atEnd());
  onQueueOf(*made.connection, [] {});
  EXPECT_EQ(made.delegate->invalidations(), 1);
  EXPECT_EQ(made.delegate->protocolError(), std::nullopt);
}

TEST_F(ConnectionTest, BeforeResumeItMayBeCancelledOrDropped) {
  auto cancelled = make();
  cancelled.connection->cancel(1s);
  EXPECT_TRUE(cancelled.peer.atEnd());
  cancelled.connection->resume(cancelled.delegate);
  EXPECT_TRUE(cancelled.delegate->waitForInvalidation());
  auto dropped = make();
  dropped.connection.reset();
  EXPECT_TRUE(dropped.peer.atEnd());
}

TEST_F(ConnectionTest, WhatIsSentOnInvalidationStillReachesAPeerThatListens) {
  auto made = make();
  made.delegate->onInvalidated = [outbox = made.connection->outbox()] {
    EXPECT_TRUE(outbox->send(notification("farewell")));
  };
  made.connection->resume(made.delegate);
  made.connection->cancel();
  EXPECT_EQ(made.peer.readToEnd(), notification("farewell"));
}

TEST_F(ConnectionTest, ShutdownSendingLetsThePeerReadOutAndSendOn) {
  auto made = open();
  const Bytes reply = response(1, std::string(3U << 20U, 'r'));
  EXPECT_TRUE(made.connection->outbox()->send(reply));
  made.connection->shutdownSending();
  EXPECT_FALSE(made.connection->outbox()->send(response(2, "too late")));
  EXPECT_EQ(made.peer.readToEnd(), reply);
  ASSERT_TRUE(made.peer.write(notification("still heard")));
  EXPECT_TRUE(made.delegate->waitForFrames(1));
  // Now both directions are shut.
  made.peer.shutdownSending();
  EXPECT_TRUE(made.delegate->waitForInvalidation());
}

TEST_F(ConnectionTest, LetsGoOfItsDelegateAndDescriptors) {
  const std::size_t before = openDescriptors();
  {
    auto made = open();
    ASSERT_TRUE(made.peer.write(notification("call")));
    ASSERT_TRUE(made.delegate->waitForFrames(1));
    const std::weak_ptr<Connection> connection = made.connection;
    made.connection.reset();
    EXPECT_FALSE(connection.expired()) << "it lives as long as its peer";
    made.peer.close();
    ASSERT_TRUE(made.delegate->waitForInvalidation());
    EXPECT_TRUE(eventually([&] { return connection.expired() && made.delegate.use_count() == 1; }));
  }
  EXPECT_EQ(openDescriptors(), before);
}

TEST_F(ConnectionTest, OnlyLargeFramesAreCarriedOutBesideTheLoop) {
  startPool(1);
  std::atomic<std::size_t> most = 0;  // threads that there were
  auto made = open([&](Connection&, Frame& frame) {
    if (frame.method != "end") most = std::max(most.load(), _pool->threadCount());
  });
  ASSERT_TRUE(made.peer.write(repeated(notification("small"), 20'000)));  // fills each read
  ASSERT_TRUE(made.delegate->waitForFrames(20'000));
  EXPECT_EQ(most, 1U);
  int frames = 20'000;
  for (const std::size_t size : {40'000, 8'000'000}) {  // whole in one read, and not
    most = 0;
    ASSERT_TRUE(made.peer.write(notification("large", {std::string(size, 'x')}) + notification("end")));
    ASSERT_TRUE(made.delegate->waitForFrames(frames += 2));
    EXPECT_EQ(most, 2U) << size;
  }
}

TEST_F(ConnectionTest, GoesWithItsPool) {
  const std::size_t before = openDescriptors();
  std::weak_ptr<RecordingDelegate> idle, stuck;
  {
    startPool(2);
    auto first = open();
    // The second waits for its peer to read.
    auto second = open(
        [](Connection& connection, Frame&) { connection.outbox()->send(response(1, std::string(2U << 20U, 'r'))); });
    ASSERT_TRUE(second.peer.write(repeated(request(1, "call"), 3)));
    ASSERT_TRUE(second.delegate->waitForFrames(1));
    onQueueOf(*second.connection, [] {});
    idle = first.delegate;
    stuck = second.delegate;
    first.connection.reset();
    second.connection.reset();
    _pool->stop();
    first.delegate.reset();
    second.delegate.reset();
    _pool.reset();
  }
  EXPECT_TRUE(idle.expired());
  EXPECT_TRUE(stuck.expired());
  EXPECT_LE(openDescriptors(), before);
}

}  // namespace
}  // namespace orvanta::test
