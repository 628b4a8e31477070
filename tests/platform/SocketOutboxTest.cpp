#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <future>
#include <thread>

#include "platform/Connection.h"
#include "tests/platform/ConnectionFixture.h"

namespace orvanta::test {
namespace {

using namespace std::chrono_literals;

class OutboxTest : public ConnectionFixture {
 protected:
  // Fills the socket's buffer and puts `beyond` bytes more into the outbox; returns what the peer will read.
  static Bytes fill(Connection& connection, std::size_t beyond) {
    const Bytes block = response(0, std::string(16U << 10U, 'f'));
    Bytes all;
    while (connection.outbox()->pending() < beyond) {
      EXPECT_TRUE(connection.outbox()->send(block));
      append(all, block);
    }
    return all;
  }
  static constexpr std::size_t kMuch = 700U << 10U;  // more than the socket's buffer
};

TEST_F(OutboxTest, StopsReadingWhileThePeerReadsNoReplies) {
  constexpr int kCalls = 200;
  const std::size_t limit = ConnectionLimits{}.maximumUnreadReplies;
  const Bytes reply = response(1, std::string(64U << 10U, 'r'));
  std::atomic<std::size_t> mostPending = 0;
  auto made = open([&](Connection& connection, Frame&) {
    mostPending = std::max(mostPending.load(), connection.outbox()->pending());
    connection.outbox()->send(reply);
  });
  ASSERT_TRUE(made.peer.write(repeated(request(1, "call"), kCalls)));
  ASSERT_TRUE(eventually([&] { return made.connection->outbox()->pending() > limit; }));
  onQueueOf(*made.connection, [] {});
  EXPECT_LT(made.delegate->frameCount(), kCalls / 2);
  // Once it reads, everything goes on.
  EXPECT_EQ(made.peer.read(reply.size() * kCalls), repeated(reply, kCalls));
  ASSERT_TRUE(made.delegate->waitForFrames(kCalls));
  EXPECT_LE(mostPending, limit) << "a call was carried out while too many replies waited";
  ASSERT_TRUE(made.peer.write(request(1, "afterwards")));
  EXPECT_EQ(made.peer.read(reply.size()), reply);
}

TEST_F(OutboxTest, APeerThatNeverReadsMayStillClose) {
  auto made = open(
      [](Connection& connection, Frame&) { connection.outbox()->send(response(1, std::string(256U << 10U, 'r'))); });
  ASSERT_TRUE(made.peer.write(repeated(request(1, "call"), 20)));
  ASSERT_TRUE(eventually([&] { return made.connection->outbox()->pending() > (1U << 20U); }));
  made.peer.close();
  ASSERT_TRUE(made.delegate->waitForInvalidation());
  EXPECT_EQ(made.delegate->frameCount(), 20) << "what had arrived is carried out";
}

TEST_F(OutboxTest, WritesWhileItsConnectionIsBusy) {
  Counter entered, release;
  auto made = open([&](Connection&, Frame&) {
    entered.add();
    release.waitFor(1);
  });
  ASSERT_TRUE(made.peer.write(notification("long")));
  ASSERT_TRUE(entered.waitFor(1));
  const Bytes sent = fill(*made.connection, 512U << 10U);
  EXPECT_EQ(made.peer.read(sent.size()), sent);
  EXPECT_TRUE(eventually([&] { return made.connection->outbox()->pending() == 0; }));
  release.add();
}

TEST_F(OutboxTest, DropsOnlyDroppableMessagesWhole) {
  const std::size_t limit = ConnectionLimits{}.maximumDroppable;
  auto made = open();
  const Bytes event = notification("event", {std::string(10'000, 'e')});
  const Bytes notice = notification("notice");
  Outbox& outbox = *made.connection->outbox();
  Bytes expected;
  while (outbox.send(event, Outbox::Urgency::droppable)) append(expected, event);
  EXPECT_LE(outbox.pending(), limit);
  EXPECT_GT(outbox.pending(), limit - 2 * event.size());
  EXPECT_TRUE(outbox.send(event));  // a reply is never dropped
  EXPECT_FALSE(outbox.send(event, Outbox::Urgency::droppable));
  EXPECT_FALSE(outbox.isClosed());
  EXPECT_TRUE(outbox.send(notice));
  expected = std::move(expected) + event + notice;
  EXPECT_EQ(made.peer.read(expected.size()), expected);
  EXPECT_TRUE(outbox.send(event, Outbox::Urgency::droppable));
  EXPECT_EQ(made.peer.read(event.size()), event);
  EXPECT_FALSE(made.peer.hasBytes());
  made.peer.close();
  ASSERT_TRUE(made.delegate->waitForInvalidation());
  std::promise<bool> behind;  // the job that tells the delegate closes the outbox at its end
  made.connection->queue()->post([&] { behind.set_value(outbox.isClosed()); });
  EXPECT_TRUE(behind.get_future().get());
}

TEST_F(OutboxTest, MessagesOfManyThreadsStayWholeAndInOrder) {
  constexpr int kThreads = 6, kMessages = 400;
  auto made = open([](Connection& connection, Frame&) { connection.outbox()->send(notification("answer")); });
  std::vector<std::thread> senders;
  for (int sender = 0; sender < kThreads; ++sender) {
    senders.emplace_back([&, sender] {
      for (int i = 0; i < kMessages; ++i) {
        const std::string filling(static_cast<std::size_t>((i * 37 + sender * 11) % 3000), 'a');
        EXPECT_TRUE(made.connection->outbox()->send(notification(std::to_string(sender), {i, filling})));
      }
    });
  }
  std::thread caller([&] {
    for (int i = 0; i < kMessages; ++i) EXPECT_TRUE(made.peer.write(notification("call")));
  });

  std::vector<std::int64_t> next(kThreads, 0);
  int answers = 0;
  for (int count = 0; count < (kThreads + 1) * kMessages; ++count) {
    const auto frame = made.peer.nextFrame();
    ASSERT_TRUE(frame);
    if (frame->method == "answer") {
      ++answers;
      continue;
    }
    const auto sender = static_cast<std::size_t>(std::stoi(frame->method));
    ASSERT_EQ(frame->params.at(0).integerValue(), next.at(sender)++);
  }
  EXPECT_EQ(answers, kMessages);
  for (auto& sender : senders) sender.join();
  caller.join();
}

TEST_F(OutboxTest, CancelGivesThePeerSomeTimeToTakeWhatWaits) {
  auto reading = open();
  const Bytes sent = fill(*reading.connection, kMuch);
  reading.connection->cancel(kHangGuard);
  onQueueOf(*reading.connection, [] {});
  EXPECT_EQ(reading.delegate->invalidations(), 0);
  EXPECT_EQ(reading.peer.readToEnd(), sent);
  EXPECT_TRUE(reading.delegate->waitForInvalidation());
  auto deaf = open();
  fill(*deaf.connection, kMuch);
  deaf.connection->cancel(20ms);
  EXPECT_TRUE(deaf.delegate->waitForInvalidation());
  EXPECT_FALSE(deaf.peer.readToEnd().empty());  // what the socket had taken; then it is closed
  EXPECT_EQ(deaf.connection->outbox()->pending(), 0U);
}

TEST_F(OutboxTest, LeavesNoDescriptorBehindAfterBackPressure) {
  const std::size_t before = openDescriptors();
  auto read = open();
  auto unread = open();
  const Bytes sent = fill(*read.connection, kMuch);
  fill(*unread.connection, kMuch);
  EXPECT_EQ(read.peer.read(sent.size()), sent);
  // While nothing waits a connection is one descriptor; with the peers' ends that makes five.
  EXPECT_TRUE(eventually([&] { return openDescriptors() == before + 5; }));
  read.peer.close();
  unread.peer.close();
  ASSERT_TRUE(read.delegate->waitForInvalidation());
  ASSERT_TRUE(unread.delegate->waitForInvalidation());
  EXPECT_TRUE(eventually([&] { return openDescriptors() == before; }));
}

// A pipe whose reading end is passed along and whose content tells it from others.
UniqueFd readableWith(int number) {
  int ends[2] = {-1, -1};
  EXPECT_EQ(::pipe(ends), 0);
  const UniqueFd writing(ends[1]);
  EXPECT_EQ(::write(writing.get(), &number, sizeof number), static_cast<ssize_t>(sizeof number));
  return UniqueFd(ends[0]);
}

int contentOf(const UniqueFd& descriptor) {
  int number = -1;
  return descriptor && ::read(descriptor.get(), &number, sizeof number) == sizeof number ? number : -1;
}

TEST_F(OutboxTest, DescriptorsTravelWithTheirMessages) {
  constexpr int kUploads = 100;
  int taken = 0;  // of the receiving queue
  auto receiver = make();
  receiver.delegate->onFrame = [&, &connection = *receiver.connection](Frame& frame) {
    if (frame.method != "upload") return;
    EXPECT_EQ(frame.params.at(0), Value(taken));
    EXPECT_EQ(contentOf(connection.takeDescriptor()), taken++);
  };
  const auto sender = Connection::create(*_pool, receiver.peer.takeSocket());
  const auto senderDelegate = std::make_shared<RecordingDelegate>();
  sender->resume(senderDelegate);
  for (int i = 0; i < kUploads; ++i) {
    EXPECT_TRUE(sender->outbox()->send(notification("event", {std::string(5000, 'e')})));
    EXPECT_TRUE(sender->outbox()->sendWithDescriptor(notification("upload", {i}), readableWith(i)));
    EXPECT_TRUE(sender->outbox()->send(notification("event")));
  }
  receiver.connection->resume(receiver.delegate);
  ASSERT_TRUE(receiver.delegate->waitForFrames(3 * kUploads));
  sender->cancel();
  ASSERT_TRUE(receiver.delegate->waitForInvalidation());
  EXPECT_EQ(taken, kUploads);
  ASSERT_TRUE(senderDelegate->waitForInvalidation());
}

TEST_F(OutboxTest, ADescriptorWaitsForItsFrameToCompleteAndIsClosedIfNobodyTakesIt) {
  int ends[2] = {-1, -1};
  ASSERT_EQ(::pipe(ends), 0);
  const UniqueFd reading(ends[0]);
  UniqueFd writing(ends[1]);
  std::vector<bool> taken;
  auto made = open([&](Connection& connection, Frame& frame) {
    if (frame.method == "upload") taken.push_back(static_cast<bool>(connection.takeDescriptor()));
  });
  const Bytes frame = notification("upload");
  ASSERT_TRUE(made.peer.write(frame));
  ASSERT_TRUE(made.delegate->waitForFrames(1));
  ASSERT_TRUE(made.peer.writeWithDescriptors(Bytes(frame.begin(), frame.begin() + 3), {writing.get()}));
  ASSERT_TRUE(made.peer.write(Bytes(frame.begin() + 3, frame.end())));
  ASSERT_TRUE(made.peer.writeWithDescriptors(notification("takesNone"), {writing.get()}));
  ASSERT_TRUE(made.delegate->waitForFrames(3));
  writing.reset();
  made.peer.close();
  ASSERT_TRUE(made.delegate->waitForInvalidation());
  EXPECT_EQ(taken, (std::vector<bool>{false, true}));
  char byte = 0;
  EXPECT_EQ(::read(reading.get(), &byte, 1), 0);  // nobody holds the other end any more
}

TEST_F(OutboxTest, TooManyWaitingDescriptorsEndTheConnection) {
  const std::size_t before = openDescriptors();
  for (const bool inOneMessage : {false, true}) {
    startPool(2);
    auto made = open();
    const UniqueFd descriptor = readableWith(1);
    const Bytes call = notification("takesNothing");
    if (inOneMessage) {
      ASSERT_TRUE(made.peer.writeWithDescriptors(call, std::vector<int>(17, descriptor.get())));
    } else {
      for (int i = 0; i < 16; ++i) ASSERT_TRUE(made.peer.writeWithDescriptors(call, {descriptor.get()}));
      ASSERT_TRUE(made.delegate->waitForFrames(16));
      EXPECT_EQ(made.delegate->invalidations(), 0);
      ASSERT_TRUE(made.peer.writeWithDescriptors(call, {descriptor.get()}));
    }
    ASSERT_TRUE(made.delegate->waitForInvalidation());
    EXPECT_TRUE(made.delegate->protocolError().has_value());
    EXPECT_EQ(made.delegate->frameCount(), inOneMessage ? 1 : 17);
    EXPECT_TRUE(made.peer.atEnd());
  }
  EXPECT_TRUE(eventually([&] { return openDescriptors() == before; }));
}

}  // namespace
}  // namespace orvanta::test
