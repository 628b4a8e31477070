#include "backends/OrvantaBackend.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cstdlib>

#include "backends/brisk/BriskBackend.h"
#include "backends/https/HTTPSPostBackend.h"
#include "tests/backends/https/HTTPSFixture.h"

namespace orvanta::test {
namespace {

TEST(SelfVersion, Parse) {
  const std::pair<const char*, SelfVersion> rows[] = {
      {"2.10.300", {2, 10, 44}}, {"7", {7, 0, 0}},         {"", {0, 0, 0}},    {"1.2.3.4", {1, 2, 3}},
      {"1.x.3", {1, 0, 3}},      {"12beta.4", {12, 4, 0}}, {"..5", {0, 0, 5}}, {"256.-1", {0, 255, 0}},
  };
  for (const auto& [text, expected] : rows) EXPECT_EQ(SelfVersion::parse(text), expected) << text;
}

class OrvantaBackendTest : public HTTPSFixture {
 protected:
  // Remembers the numbers of its events and opens up the lists.
  struct Recorder final : OrvantaBackend {
    using OrvantaBackend::OrvantaBackend;
    using OrvantaBackend::setEventBlacklist;
    using OrvantaBackend::setEventWhitelist;
    std::optional<std::string> sendNumbered(const Event& event) override {
      last = event.number;
      return "sent";
    }
    int last = -1;
  };
};

TEST_F(OrvantaBackendTest, EventNumbersWrap) {
  Recorder backend(platform, "x", shared({}), {});
  for (int i = 1; i <= 65536; ++i) {
    EXPECT_EQ(send(backend, 1), "sent");
    ASSERT_EQ(backend.last, i % 65536);
  }
}

TEST_F(OrvantaBackendTest, Lists) {
  using List = std::vector<std::int32_t>;
  Recorder backend(platform, "x", shared({}), {});
  EXPECT_TRUE(backend.isWhitelistedEvent(12) && !backend.isBlacklistedEvent(12)) << "no list";
  backend.setEventWhitelist(List{});
  backend.setEventBlacklist(List{});
  EXPECT_FALSE(backend.isWhitelistedEvent(12) || backend.isBlacklistedEvent(12)) << "empty lists";
  backend.setEventWhitelist(List{-1, 12, 65536});
  backend.setEventBlacklist(List{12});
  EXPECT_TRUE(backend.isWhitelistedEvent(12) && backend.isBlacklistedEvent(12));
  EXPECT_FALSE(backend.isWhitelistedEvent(0)) << "65536 is not a category, and not category 0";
  EXPECT_FALSE(backend.isWhitelistedEvent(65535)) << "neither is -1";
}

// Where the process's generator stands. Reading it means setting it; it is set back at once.
std::array<unsigned short, 3> generatorState() {
  unsigned short zero[3] = {0, 0, 0};
  std::array<unsigned short, 3> state{};
  const unsigned short* before = ::seed48(zero);
  std::copy_n(before, state.size(), state.begin());
  auto restored = state;
  ::seed48(restored.data());
  return state;
}

TEST_F(OrvantaBackendTest, EachBackendDrawsOnceFromTheGenerator) {
  const LogCapture log;
  auto state = generatorState();
  BackendSetup setup;
  setup.identity.productFamily = "Parva";
  for (int i = 0; i < 3; ++i) {
    // These construct nothing and so draw nothing.
    EXPECT_EQ(HTTPSPostBackend::create(platform, "http_post", nullptr, setup), nullptr);
    EXPECT_EQ(HTTPSPostBackend::create(platform, "http_post", shared({{"clients", "Mail"}}), setup), nullptr);
    EXPECT_EQ(HTTPSPostBackend::create(platform, "http_post", shared(profileOf({})), {}), nullptr);
    // This one is constructed before it is refused.
    ::erand48(state.data());
    EXPECT_EQ(BriskBackend::create(platform, "brisk", nullptr, setup), nullptr);
    const double expected = ::erand48(state.data());
    const auto backend = HTTPSPostBackend::create(platform, "http_post", shared(profileOf({})), setup);
    EXPECT_EQ(backend->samplingFactor(), expected);
    EXPECT_TRUE(expected >= 0 && expected < 1);
  }
  EXPECT_EQ(log.count("<3>HTTPSPostBackend(initWithName): can't find the client list."), 3U);
}

}  // namespace
}  // namespace orvanta::test
