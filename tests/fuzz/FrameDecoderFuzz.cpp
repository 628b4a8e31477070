#include <algorithm>
#include <string>
#include <vector>

#include "platform/ipc/FrameDecoder.h"
#include "tests/fuzz/Require.h"

namespace {

using namespace orvanta::platform;

constexpr FrameLimits kLimits{4096, 64U << 10U, 16};

// The decoder's output, in a form that can be compared (NaN is not equal to itself).
std::string describe(const Frame& frame) {
  std::vector<std::uint8_t> values;
  MessagePackWriter writer(values);
  writer.array(frame.params);
  writer.value(frame.error);
  writer.value(frame.result);
  std::string text = std::to_string(static_cast<int>(frame.kind)) + " " + std::to_string(frame.messageID) + " " +
                     frame.method + " " + std::to_string(frame.wireSize) + " " + std::to_string(frame.charge) + " " +
                     frame.refusal.value_or("");
  return text.append(values.begin(), values.end());
}

std::vector<std::string> decode(std::span<const std::uint8_t> stream, std::size_t step) {
  FrameDecoder decoder(kLimits);
  std::vector<std::string> result;
  for (;;) {
    const std::size_t size = std::min(step, stream.size());
    decoder.append(stream.first(size));
    stream = stream.subspan(size);
    for (;;) {
      const FrameDecoder::Outcome outcome = decoder.next();
      if (std::holds_alternative<FrameDecoder::NeedMore>(outcome)) break;
      if (const auto* error = std::get_if<FrameDecoder::ProtocolError>(&outcome)) {
        result.push_back(error->text);
        return result;
      }
      const Frame& frame = std::get<Frame>(outcome);
      REQUIRE(frame.wireSize >= 4 && frame.wireSize <= kLimits.maximumFrame);
      REQUIRE(frame.charge <= kLimits.maximumCharge + sizeof(Frame));
      result.push_back(describe(frame));
    }
    if (stream.empty()) return result;
  }
}

}  // namespace

// The first byte cuts the stream; any cut gives the same as the whole.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
  if (size == 0) return 0;
  const std::span<const std::uint8_t> stream(bytes + 1, size - 1);
  const std::vector<std::string> whole = decode(stream, std::max<std::size_t>(stream.size(), 1));
  REQUIRE(decode(stream, std::size_t{bytes[0]} + 1) == whole);
  REQUIRE(decode(stream, 1) == whole);
  return 0;
}
