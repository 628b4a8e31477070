#include "tools/collector/Inbox.h"

#include <gmock/gmock.h>

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

TEST_F(InboxTest, SaysWhyItCannotOpen) {
  EXPECT_FALSE(Inbox::open(_directory / "no/such/place", {}));
  _directory.write("inbox.sqlite", "this is no database, as its beginning shows");
  const auto opened = Inbox::open(_directory / "inbox.sqlite", {});
  ASSERT_FALSE(opened);
  EXPECT_THAT(opened.error(), testing::HasSubstr("inbox.sqlite"));
}

}  // namespace
}  // namespace orvanta::collector
