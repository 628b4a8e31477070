#include "backends/OrvantaBackend.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cstdlib>

#include "backends/BackendFactory.h"
#include "backends/HTTPSPostBackend.h"
#include "tests/backends/HTTPSFixture.h"

namespace orvanta::test {
namespace {

using SelfVersion = OrvantaBackend::SelfVersion;

TEST(SelfVersion, Parse) {
  const std::pair<const char*, SelfVersion> rows[] = {
      {"2.10.300", {2, 10, 44}}, {"7", {7, 0, 0}},         {"", {0, 0, 0}},    {"1.2.3.4", {1, 2, 3}},
      {"1.x.3", {1, 0, 3}},      {"12beta.4", {12, 4, 0}}, {"..5", {0, 0, 5}}, {"256.-1", {0, 255, 0}},
  };
  for (const auto& [text, expected] : rows) EXPECT_EQ(SelfVersion::parse(text), expected) << text;
  EXPECT_EQ((SelfVersion{8, 0, 0}.text()), "8.0");
  EXPECT_EQ((SelfVersion{4, 2, 1}.text()), "4.2.1");
}

TEST(ConvertIntoSHA256, KnownDigests) {
  EXPECT_EQ(OrvantaBackend::convertIntoSHA256(""), "e3b0c44298fc1c149afbf4c8996fb92427ae41e4649b934ca495991b7852b855");
  EXPECT_EQ(OrvantaBackend::convertIntoSHA256("abc"),
            "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad");
  EXPECT_NE(OrvantaBackend::convertIntoSHA256("\xC3\xA4"), OrvantaBackend::convertIntoSHA256("a"));
}

class OrvantaBackendTest : public HTTPSFixture {
 protected:
  // Remembers the numbers of its events and opens up the lists.
  struct Recorder final : OrvantaBackend {
    using OrvantaBackend::OrvantaBackend;
    using OrvantaBackend::sendMessage;
    using OrvantaBackend::setEventBlacklist;
    using OrvantaBackend::setEventWhitelist;
    std::optional<std::string> sendMessage(const SharedDictionary&, platform::TimeValue, std::uint16_t, std::uint16_t,
                                           std::uint16_t eventID, std::int32_t) override {
      last = eventID;
      return "sent";
    }
    int last = -1;
  };
};

TEST_F(OrvantaBackendTest, EventNumbersWrap) {
  Recorder backend(platform, "x", shared({}), "Parva");
  EXPECT_EQ(send(backend, 1), "sent");
  EXPECT_EQ(backend.last, 1);
  for (int i = 2; i <= 65535; ++i) send(backend, 1);
  EXPECT_EQ(backend.last, 65535);
  send(backend, 1);
  EXPECT_EQ(backend.last, 0);
}

TEST_F(OrvantaBackendTest, Lists) {
  Recorder backend(platform, "x", shared({}), "Parva");
  EXPECT_TRUE(backend.isWhitelistedEvent(12));
  EXPECT_FALSE(backend.isBlacklistedEvent(12));
  backend.setEventWhitelist(std::vector<std::int32_t>{});
  backend.setEventBlacklist(std::vector<std::int32_t>{});
  EXPECT_FALSE(backend.isWhitelistedEvent(12));
  EXPECT_FALSE(backend.isBlacklistedEvent(12));
  backend.setEventWhitelist(std::vector<std::int32_t>{-1, 12, 65536});
  backend.setEventBlacklist(std::vector<std::int32_t>{12});
  EXPECT_TRUE(backend.isWhitelistedEvent(12));
  EXPECT_TRUE(backend.isBlacklistedEvent(12));
  EXPECT_FALSE(backend.isWhitelistedEvent(0)) << "65536 is no category, and not category 0";
  EXPECT_FALSE(backend.isWhitelistedEvent(65535)) << "neither is -1";
}

TEST_F(OrvantaBackendTest, Defaults) {
  OrvantaBackend backend(platform, "x", shared({}), "Parva");
  EXPECT_EQ(backend.state(), kBackendWaiting);
  backend.updateState();
  EXPECT_EQ(backend.state(), kBackendEnabled);
  EXPECT_EQ(send(backend, 1), std::nullopt);
  EXPECT_FALSE(backend.uploadLogData(nullptr));
  EXPECT_FALSE(backend.uploadFileAtPath({}));
  int calls = 0;
  EXPECT_EQ(backend.flushMessagesWithCompletion([&](auto text, auto error) {
    ++calls;
    EXPECT_FALSE(text || error);
  }),
            std::nullopt);
  EXPECT_EQ(calls, 1);
  EXPECT_EQ(backend.flushMessagesWithCompletion({}), std::nullopt);
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
  auto state = generatorState();
  for (int i = 0; i < 3; ++i) {
    // These construct nothing and so draw nothing.
    HTTPSPostBackend::create(platform, "http_post", nullptr, "Parva");
    HTTPSPostBackend::create(platform, "http_post", shared({}), "Parva");
    HTTPSPostBackend::create(platform, "http_post", shared(profileOf({})), "");
    const double expected = ::erand48(state.data());
    const auto backend = HTTPSPostBackend::create(platform, "http_post", shared(profileOf({})), "Parva");
    EXPECT_EQ(backend->samplingFactor(), expected);
    EXPECT_TRUE(expected >= 0 && expected < 1);
  }
}

TEST_F(OrvantaBackendTest, FactoryMakesHTTPSBackends) {
  for (const char* name : {"http_post", "http_post2"}) {
    const auto backend = newBackendWithName(platform, name, shared(profileOf({})), "Parva", 5);
    ASSERT_NE(backend, nullptr) << name;
    EXPECT_NE(dynamic_cast<HTTPSPostBackend*>(backend.get()), nullptr);
    EXPECT_EQ(backend->name(), name);
  }
}

TEST_F(OrvantaBackendTest, FactoryRefusesUnknownNames) {
  const LogCapture log;
  for (const char* name : {"", "http_post3", "HTTP_POST", "http_pos"}) {
    EXPECT_EQ(newBackendWithName(platform, name, shared(profileOf({})), "Parva", 5), nullptr) << name;
    EXPECT_EQ(log.lines().back(), "<3>OrvantaBackend(newBackendWithName): " + std::string(name));
  }
}

}  // namespace
}  // namespace orvanta::test
