#include "tools/collector/store/Inbox.h"

#include <gmock/gmock.h>

#include "platform/codec/Json.h"
#include "tests/support/TemporaryDirectory.h"

namespace orvanta::collector {
namespace {

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
  for (const bool byBytes : {false, true}) {
    InboxLimits limits;
    limits.maximumRequests = byBytes ? 1000 : 20;
    if (byBytes) limits.maximumBytes = 20'000;
    const auto inbox = open(limits);
    inbox->clear();
    for (int i = 1; i <= 100; ++i) {
      ReceivedRequest request = post(i, byBytes ? 1000 : 1);
      inbox->add(request);
      ASSERT_LE(inbox->counts().requests, 20U);
    }
    EXPECT_EQ(inbox->requests().back().exchange, 100);
    EXPECT_EQ(inbox->events().size(), inbox->requests().size());
    EXPECT_GE(inbox->counts().requests, byBytes ? 10U : 17U) << "takes a tenth at a time";
  }
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
