#include "platform/ipc/FrameDecoder.h"

#include <algorithm>
#include <limits>

#include "interface/RemoteCalls.h"
#include "platform/ipc/Connection.h"
#include "tests/platform/codec/CodecRows.h"
#include "tests/support/Bytes.h"

namespace orvanta::platform {
namespace {

using Bytes = std::vector<std::uint8_t>;
using namespace orvanta::test;

std::string describe(const Frame& frame) {
  const bool isResponse = frame.kind == Frame::Kind::response;
  std::string text = isResponse ? "response " : frame.kind == Frame::Kind::request ? "request " : "notification ";
  if (frame.kind != Frame::Kind::notification) text += std::to_string(frame.messageID) + " ";
  if (!isResponse) text += frame.method + " ";
  if (frame.refusal) return text + "refused: " + *frame.refusal;
  if (isResponse) return text + frame.error.description() + " " + frame.result.description();
  return text + Value(frame.params).description();
}

// Everything that comes out when `stream` is appended in pieces of that size: one line a frame, and the error.
std::vector<std::string> decode(std::span<const std::uint8_t> stream, std::size_t piece, FrameLimits limits) {
  FrameDecoder decoder(limits);
  std::vector<std::string> lines;
  std::size_t waiting = 0;
  while (!stream.empty()) {
    const auto part = stream.first(std::min(piece, stream.size()));
    decoder.append(part);
    stream = stream.subspan(part.size());
    waiting += part.size();
    for (;;) {
      FrameDecoder::Outcome outcome = decoder.next();
      if (const auto* error = std::get_if<FrameDecoder::ProtocolError>(&outcome)) {
        lines.push_back("error: " + error->text);
        decoder.append(fromHex("93 02 a1 'n' 90"));
        outcome = decoder.next();
        EXPECT_EQ("error: " + std::get<FrameDecoder::ProtocolError>(outcome).text, lines.back()) << "errors are final";
        EXPECT_EQ(decoder.pending(), 0U);
        return lines;
      }
      if (std::holds_alternative<FrameDecoder::NeedMore>(outcome)) break;
      const Frame& frame = std::get<Frame>(outcome);
      waiting -= frame.wireSize;
      lines.push_back(describe(frame));
    }
    EXPECT_EQ(decoder.pending(), waiting);
  }
  if (waiting > 0) lines.emplace_back("more");
  return lines;
}

// The same at once and byte by byte, which take different ways through the decoder.
std::vector<std::string> decodeBothWays(const Bytes& stream, FrameLimits limits = kFrameLimits) {
  std::vector<std::string> atOnce = decode(stream, stream.size(), limits);
  EXPECT_EQ(decode(stream, 1, limits), atOnce);
  return atOnce;
}

TEST(FrameDecoder, TakesTheThreeShapes) {
  const std::pair<const char*, const char*> rows[] = {
      {"94 00 07 a1 'f' 91 01", "request 7 f {1}"},
      {"dd 00 00 00 04 cc 00 d0 07 d9 01 'f' dc 00 01 c0", "request 7 f {null}"},
      {"93 02 a1 'f' 91 81 a1 'k' c3", "notification f {{k = 1}}"},
      {"94 01 07 c0 91 a1 'x'", "response 7 null {x}"},
      {"94 01 07 a1 'e' c0", "response 7 e null"},
  };
  for (const auto& [hex, expected] : rows) {
    EXPECT_EQ(decodeBothWays(fromHex(hex)), std::vector<std::string>{expected}) << hex;
  }
}

// Refused calls keep their message id, and the stream goes on behind them.
TEST(FrameDecoder, RefusesCallsForTheirArguments) {
  const std::pair<const char*, const char*> rows[] = {
      {"94 00 07 a1 'f' c0", "request 7 f refused: params that are no array at byte 5"},
      {"94 00 07 a1 'f' 91 82 a1 'k' 01 a1 'k' 02", "request 7 f refused: a map with the key \"k\" twice at byte 6"},
      {"94 00 07 a1 'f' 91 d4 05 00", "request 7 f refused: extension type 5 at byte 6"},
      {"94 00 07 a1 'f' 91 ca 00 00 00 00",
       "request 7 f refused: a float32, where numbers with a fraction are float64, at byte 6"},
      {"94 00 07 a1 'f' 91 81 92 01 02 90", "request 7 f refused: a map key that is not text at byte 7"},
      {"94 00 07 a1 'f' 91 a1 ff", "request 7 f refused: text that is not UTF-8 at byte 7"},
      {"94 00 07 a1 ff 90", "request 7  refused: text that is not UTF-8 at byte 4"},
      {"93 02 a1 'f' 92 d4 05 00 a1 ff", "notification f refused: extension type 5 at byte 5"},
      {"94 01 07 c0 d5 ff 00 00", "response 7 refused: a timestamp of 2 bytes at byte 4"},
  };
  for (const auto& [hex, expected] : rows) {
    EXPECT_EQ(decodeBothWays(fromHex(std::string(hex) + "93 02 a1 'n' 90")),
              (std::vector<std::string>{expected, "notification n {}"}))
        << hex;
  }
}

TEST(FrameDecoder, EndsWithAProtocolErrorAfterTheWholeFramesBefore) {
  const std::pair<const char*, std::vector<const char*>> rows[] = {
      {"begins no MessagePack value", {"c1", "94 00 07 a1 'f' 92 d4 05 00 c1"}},
      {"no array", {"'GET / HTTP/1.1'", "c0", "84 00 07 a1 'f' 90"}},
      {"no array of three or four", {"90", "92 02 a1 'f'", "dd 00 00 ff ff", "95 00 07 a1 'f' 90 c0"}},
      {"bytes in memory", {"dd ff ff ff ff", "94 00 07 a1 'f' dd ff ff ff ff"}},
      {"bytes", {"94 00 07 a1 'f' 91 db ff ff ff ff", "94 00 07 a1 'f' 91 c9 ff ff ff ff 05"}},
      {"message type", {"94 03", "94 ff", "94 a1 00"}},
      {"type 0 with 3 elements", {"93 00 07 a1"}},
      {"type 1 with 3 elements", {"93 01"}},
      {"type 2 with 4 elements", {"94 02"}},
      {"message id", {"94 00 ff", "94 00 cf 00 00 00 01 00 00 00 00", "94 00 a1 '7'"}},
      {"method name", {"94 00 07 c4 01 'f'", "93 02 07"}},
  };
  for (const auto& [expected, inputs] : rows) {
    for (const std::string hex : inputs) {
      const std::vector<std::string> lines = decodeBothWays(fromHex("93 02 a1 'n' 90 93 02 a1 'm' 90" + hex));
      ASSERT_EQ(lines.size(), 3U) << hex;
      EXPECT_EQ(lines[0] + lines[1], "notification n {}notification m {}");
      EXPECT_NE(lines[2].find(expected), std::string::npos) << hex << ": " << lines[2];
    }
  }
}

TEST(FrameDecoder, BoundsDepthCountingTheFrame) {
  for (const std::string open : {"91", "81 a0"}) {
    std::string deep = "93 02 a1 'f' 91";  // two deep
    for (int depth = 3; depth < 64; ++depth) deep += open;
    EXPECT_NE(decodeBothWays(fromHex(deep + "80")).front().find("notification"), std::string::npos);
    EXPECT_NE(decodeBothWays(fromHex(deep + open + "80")).front().find("deeper than 64"), std::string::npos);
  }
  // Too deep already, although the frame goes on.
  Bytes open = fromHex("93 02 a1 'f'");
  open.insert(open.end(), 64, 0x92);
  EXPECT_NE(decodeBothWays(open).front().find("deeper than 64"), std::string::npos);
  // Too deep and too large at once.
  EXPECT_NE(decodeBothWays(fromHex("93 02 a1 'f' 91 9f"), {64, 300, 2}).front().find("in memory"), std::string::npos);
}

TEST(FrameDecoder, BoundsTheFrameOnTheWire) {
  const FrameLimits limits{32, 1U << 20U, 64};
  const auto frameOf = [](std::size_t size) {
    Bytes bytes;
    appendNotificationHeader(bytes, "f", 1);
    MessagePackWriter(bytes).data(Bytes(size - bytes.size() - 2));
    return bytes;
  };
  Bytes two = frameOf(32);
  const Bytes second = frameOf(31);
  two.insert(two.end(), second.begin(), second.end());
  EXPECT_EQ(decodeBothWays(two, limits).size(), 2U);
  EXPECT_NE(decodeBothWays(frameOf(33), limits).front().find("more than 32 bytes"), std::string::npos);
  // A claim is enough, whether of bytes or of values.
  for (const char* hex : {"93 02 a1 'f' c4 1b", "93 02 a1 'f' dc 00 1a", "93 02 d9 30", "93 02 a1 'f' 91 de 00 0e"}) {
    EXPECT_NE(decodeBothWays(fromHex(hex), limits).front().find("more than 32 bytes"), std::string::npos) << hex;
  }
}

TEST(FrameDecoder, ChargesValuesAtTheirSizeInMemory) {
  Bytes bytes;
  appendNotificationHeader(bytes, "f", 1);
  MessagePackWriter(bytes).array(Array(1000));
  const auto within = [&](std::size_t charge) { return decodeBothWays(bytes, {64U << 20U, charge, 64}).front(); };
  EXPECT_EQ(within(1000 * sizeof(Value) + 1000).find("error"), std::string::npos);
  EXPECT_NE(within(1000 * sizeof(Value) - 1).find("in memory"), std::string::npos);
  // The default limits are for this: a frame of nils as large as a frame may be.
  bytes.clear();
  appendNotificationHeader(bytes, "f", (64U << 20U) - 20);
  EXPECT_NE(decode(bytes, bytes.size(), {}).front().find("in memory"), std::string::npos);
}

TEST(FrameDecoder, AllocatesNothingForMissingBytes) {
  constexpr std::size_t kHuge = std::numeric_limits<std::size_t>::max() / 2;
  for (const char* hex : {"93 02 a1 'f' dd ff ff ff ff", "93 02 a1 'f' 91 df ff ff ff ff", "94 01 07 dd ff ff ff ff",
                          "93 02 db ff ff ff ff", "93 02 a1 'f' 92 dd ff ff ff ff c0"}) {
    EXPECT_EQ(decodeBothWays(fromHex(hex), {kHuge, kHuge, 64}), std::vector<std::string>{"more"}) << hex;
  }
}

}  // namespace
}  // namespace orvanta::platform
