#include "platform/codec/PropertyList.h"
#include "tests/fuzz/Require.h"

// A value that can be read is the same when it is written and read again.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
  using namespace orvanta::platform;
  const Result<Value> parsed = parseXmlPropertyList({bytes, size}, {64, 10'000, 1U << 20U});
  if (!parsed) {
    REQUIRE(!parsed.error().empty());
    return 0;
  }
  const Result<std::string> written = writeXmlPropertyList(*parsed);
  REQUIRE(written.ok());
  const Result<Value> again =
      parseXmlPropertyList({reinterpret_cast<const std::uint8_t*>(written->data()), written->size()});
  REQUIRE(again.ok());
  const Result<std::string> rewritten = writeXmlPropertyList(*again);
  REQUIRE(rewritten.ok());
  REQUIRE(*rewritten == *written);
  return 0;
}
