#include <gtest/gtest.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>

#include "platform/ipc/Connection.h"
#include "tests/platform/ipc/ConnectionFixture.h"

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
  const std::size_t limit = kDaemonConnectionLimits.maximumUnreadReplies;
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

// A descriptor that is told from others by what can be read from it.
UniqueFd readableWith(std::uint8_t number) {
  return UniqueFd(::eventfd(number, EFD_CLOEXEC | EFD_NONBLOCK));
}

TEST_F(OutboxTest, DescriptorsTravelWithTheirMessages) {
  constexpr std::uint8_t kUploads = 100;
  int taken = 0;  // of the receiving queue
  auto receiver = make();
  receiver.delegate->onFrame = [&, &connection = *receiver.connection](Frame& frame) {
    if (frame.method != "upload") return;
    EXPECT_EQ(frame.params.at(0), Value(++taken));
    const UniqueFd descriptor = connection.takeDescriptor();
    eventfd_t content = 0;
    EXPECT_EQ(::eventfd_read(descriptor.get(), &content), 0);
    EXPECT_EQ(content, static_cast<eventfd_t>(taken));
  };
  const auto sender = Connection::create(*_pool, receiver.peer.takeSocket(), kDaemonConnectionLimits);
  const auto senderDelegate = std::make_shared<RecordingDelegate>();
  sender->resume(senderDelegate);
  for (std::uint8_t i = 1; i <= kUploads; ++i) {
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

TEST_F(OutboxTest, ADescriptorWaitsForItsFrameToCompleteAndIsClosedIfItIsNotTaken) {
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
  EXPECT_EQ(::read(reading.get(), &byte, 1), 0);  // the other end is closed everywhere
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
