#include "platform/codec/Json.h"
#include "tests/fuzz/Require.h"

// A value that can be read is the same when it is written, in either way, and read again; any bytes make a JSON text.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
  using namespace orvanta::platform;
  const std::string_view text(reinterpret_cast<const char*>(bytes), size);
  std::string quoted;
  appendJsonString(quoted, text);
  const Result<Value> unquoted = parseJson(quoted);
  REQUIRE(unquoted.ok());
  REQUIRE(unquoted->string() != nullptr);
  if (isValidUtf8(text)) REQUIRE(*unquoted->string() == text);

  const Result<Value> parsed = parseJson(text);
  if (!parsed) {
    REQUIRE(!parsed.error().empty());
    return 0;
  }
  const std::string written = writeJson(*parsed);
  for (const bool pretty : {false, true}) {
    const Result<Value> again = parseJson(writeJson(*parsed, pretty));
    REQUIRE(again.ok());
    REQUIRE(writeJson(*again) == written);
  }
  return 0;
}
