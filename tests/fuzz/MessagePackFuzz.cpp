#include "platform/codec/MessagePack.h"
#include "tests/fuzz/Require.h"

// A value that can be read is the same when it is written and read again, and takes no more bytes.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
  using namespace orvanta::platform;
  constexpr MessagePackLimits kLimits{64, 1U << 20U};
  const Result<Value> parsed = decodeMessagePack({bytes, size}, kLimits);
  if (!parsed) {
    REQUIRE(!parsed.error().empty());
    return 0;
  }
  std::vector<std::uint8_t> written;
  MessagePackWriter(written).value(*parsed);
  REQUIRE(written.size() <= size);
  const Result<Value> again = decodeMessagePack(written, kLimits);
  REQUIRE(again.ok());
  std::vector<std::uint8_t> rewritten;
  MessagePackWriter(rewritten).value(*again);
  REQUIRE(rewritten == written);
  return 0;
}
