#include "backends/VoltmarkBackend.h"

#include <gtest/gtest.h>

#include "tests/support/TestPlatform.h"

namespace orvanta {
namespace {

using platform::Dictionary;

TEST(VoltmarkBackend, RecordsEventsWithACategoryAndAPayload) {
  test::TestPlatform platform;
  const auto backend = VoltmarkBackend::create(platform, "voltmark", nullptr, "Parva");
  const auto send = [&](std::uint16_t method, std::optional<Dictionary> payload) {
    const auto shared = payload ? std::make_shared<const Dictionary>(*payload) : nullptr;
    EXPECT_EQ(backend->sendMessage(shared, {}, method, 2, 9, 1), std::nullopt);
  };
  send(0, Dictionary{{"x", 1}});
  send(5, std::nullopt);
  send(5, Dictionary{});
  EXPECT_TRUE(platform.powerLog.records.empty());

  send(5, Dictionary{{"x", 1}});
  send(65535, Dictionary{{"method", "theirs"}, {"respCode", nullptr}, {"event", Dictionary{}}});
  ASSERT_EQ(platform.powerLog.records.size(), 2U);
  for (const auto& record : platform.powerLog.records) {
    EXPECT_EQ(record.event, 28);
    EXPECT_EQ(record.sender, "Vesperd-ORV");
  }
  EXPECT_EQ(platform.powerLog.records[0].record, (Dictionary{{"x", 1}, {"method", 5}, {"respCode", 2}, {"event", 9}}));
  EXPECT_EQ(platform.powerLog.records[1].record, (Dictionary{{"method", 65535}, {"respCode", 2}, {"event", 9}}));
}

}  // namespace
}  // namespace orvanta
