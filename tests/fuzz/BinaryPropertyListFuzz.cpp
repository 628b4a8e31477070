#include "platform/codec/PropertyList.h"
#include "tests/fuzz/Require.h"

// A value that can be read and written is the same when it is read and written again.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
  using namespace orvanta::platform;
  const PropertyListLimits limits{64, 10'000, 1U << 20U};
  const Result<Value> parsed = parseBinaryPropertyList({bytes, size}, limits);
  if (!parsed) {
    REQUIRE(!parsed.error().empty());
    return 0;
  }
  const Result<std::vector<std::uint8_t>> written = writeBinaryPropertyList(*parsed);
  if (!written) return 0;  // null has no written form
  const Result<Value> again = parseBinaryPropertyList(*written);
  REQUIRE(again.ok());
  const Result<std::vector<std::uint8_t>> rewritten = writeBinaryPropertyList(*again);
  REQUIRE(rewritten.ok());
  REQUIRE(*rewritten == *written);
  return 0;
}
