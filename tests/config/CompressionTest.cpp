#include "config/Compression.h"

#include <gtest/gtest.h>

#include <random>
#include <thread>

#include "tests/support/LogCapture.h"
#include "tests/support/Threads.h"
#include "tools/collector/wire/MessageReader.h"

namespace orvanta {
namespace {

// Nullopt when the stream is damaged, incomplete or followed by more bytes.
std::optional<std::string> inflated(const std::string& compressed) {
  auto content = collector::inflateBody(compressed, 2U << 20U);
  return content ? std::optional(std::move(*content)) : std::nullopt;
}

std::string randomBytes(std::size_t count) {
  std::mt19937 generator(count);
  std::string bytes(count, '\0');
  for (char& byte : bytes) byte = static_cast<char>(generator());
  return bytes;
}

TEST(Compression, roundTripsThroughBothContainers) {
  for (int round = 0; round < 2; ++round) {
    for (const std::string& input : {std::string(1, '\0'), std::string("{\"postTime\":1}"), std::string(1U << 20U, 'a'),
                                     randomBytes(100'000), randomBytes(1U << 17U)}) {
      const auto gzip = compressDataWithZlibOrGzip(true, input);
      ASSERT_TRUE(gzip);
      EXPECT_EQ(gzip->substr(0, 3), "\x1f\x8b\x08");
      EXPECT_EQ(inflated(*gzip), input);
      std::optional<std::string> onFreshStream;
      std::thread([&] { onFreshStream = gzipDeflate(input); }).join();
      EXPECT_EQ(onFreshStream, gzip) << "nothing of an earlier body shows";
      const auto zlib = compressDataWithZlibOrGzip(false, input);
      ASSERT_TRUE(zlib);
      EXPECT_EQ(inflated(*zlib), input);
      EXPECT_EQ(zlib->front(), '\x78') << "no gzip";
    }
  }
}

TEST(Compression, threadsDoNotShareStreams) {
  test::inThreads(4, [](int thread) {
    for (int round = 1; round <= 50; ++round) {
      const std::string input = randomBytes(static_cast<std::size_t>(thread * 1000 + round));
      EXPECT_EQ(inflated(gzipDeflate(input).value_or("")), input);
    }
  });
}

TEST(Compression, logsWhatItDid) {
  const test::LogCapture log;
  EXPECT_FALSE(gzipDeflate(""));
  EXPECT_FALSE(compressDataWithZlibOrGzip(false, ""));
  EXPECT_EQ(log.count("<3>compressDataWithZlibOrGzip: Cannot compress empty Dacto"), 2);
  const auto compressed = gzipDeflate(std::string(1U << 20U, 'a'));
  ASSERT_TRUE(compressed);
  EXPECT_EQ(log.lines().back(),
            "<7>compressDataWithZlibOrGzip: Compressed file from 1048576 to " + std::to_string(compressed->size()));
}

}  // namespace
}  // namespace orvanta
