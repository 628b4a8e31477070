#include "tools/collector/Inbox.h"

#include <gmock/gmock.h>

#include <future>

#include "platform/Json.h"
#include "tests/support/TemporaryDirectory.h"

namespace orvanta::collector {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;

class InboxTest : public testing::Test {
 protected:
  std::unique_ptr<Inbox> open(const InboxLimits& limits = {}) const {
    auto inbox = Inbox::open(_directory / "inbox.sqlite", limits);
    EXPECT_TRUE(inbox) << inbox.error();
    return inbox ? std::move(inbox.value()) : nullptr;
  }
  static ReceivedRequest post(std::int64_t exchange, std::size_t bytes) {
    ReceivedRequest request;
    request.kind = RequestKind::events;
    request.exchange = exchange;
    request.headers = {{"B", "1"}, {"a", "\xC3\xA9 \"quoted\""}};
    request.rawBody = std::string(bytes, '\0');
    request.body = "decoded";
    request.json = std::make_shared<const Value>(Dictionary{{"events", Array{Dictionary{{"n", exchange}}}}});
    return request;
  }
  test::TemporaryDirectory _directory;
};

TEST_F(InboxTest, GivesBackWhatItWasGiven) {
  const auto inbox = open();
  ReceivedRequest request = post(5, 10);
  inbox->add(request);
  EXPECT_EQ(request.id, 1);
  const auto stored = inbox->requestOfExchange(5);
  ASSERT_TRUE(stored);
  EXPECT_EQ(stored->headers, request.headers);
  EXPECT_EQ(stored->rawBody, request.rawBody);
  EXPECT_EQ(stored->body, "decoded");
  EXPECT_FALSE(inbox->request(2));
  EXPECT_EQ(inbox->nextExchange(), 1);
  EXPECT_EQ(open()->nextExchange(), 6);
}

TEST_F(InboxTest, ForgetsTheOldestBeyondItsLimits) {
  InboxLimits limits;
  limits.maximumRequests = 20;
  const auto byNumber = open(limits);
  for (int i = 1; i <= 100; ++i) {
    ReceivedRequest request = post(i, 1);
    byNumber->add(request);
    ASSERT_LE(byNumber->counts().requests, 20U);
  }
  EXPECT_EQ(byNumber->requests().back().exchange, 100);
  EXPECT_EQ(byNumber->events().size(), byNumber->requests().size());
  EXPECT_GE(byNumber->counts().requests, 17U) << "takes a tenth at a time";

  limits.maximumRequests = 1000;
  limits.maximumBytes = 10'000;
  byNumber->clear();
  const auto byBytes = open(limits);
  for (int i = 1; i <= 50; ++i) {
    ReceivedRequest request = post(i, 1000);
    byBytes->add(request);
    ASSERT_LE(byBytes->counts().requests, 10U);
  }
  EXPECT_EQ(byBytes->requests().back().exchange, 50);
}

TEST_F(InboxTest, WakesWhoWaits) {
  const auto inbox = open();
  EXPECT_FALSE(inbox->waitForCounts({1, 0, 0}, std::chrono::milliseconds(1)));
  auto counted = std::async(std::launch::async, [&] {
    return inbox->waitForCounts({3, 3, 0}, std::chrono::seconds(30));
  });
  auto found = std::async(std::launch::async, [&] {
    return inbox->waitUntil([&] { return inbox->requestOfExchange(3).has_value(); }, std::chrono::seconds(30));
  });
  for (int i = 1; i <= 3; ++i) {
    ReceivedRequest request = post(i, 1);
    inbox->add(request);
  }
  EXPECT_TRUE(counted.get());
  EXPECT_TRUE(found.get());
}

TEST_F(InboxTest, SaysWhyItCannotOpen) {
  EXPECT_FALSE(Inbox::open(_directory / "no/such/place", {}));
  _directory.write("inbox.sqlite", "this is no database, as its beginning shows");
  const auto opened = Inbox::open(_directory / "inbox.sqlite", {});
  ASSERT_FALSE(opened);
  EXPECT_THAT(opened.error(), testing::HasSubstr("inbox.sqlite"));
}

}  // namespace
}  // namespace orvanta::collector
