#include "platform/codec/MessagePack.h"

#include <bit>
#include <cmath>
#include <limits>

#include <fmt/format.h>

#include "platform/codec/MessagePackReader.h"

namespace orvanta::platform {

namespace {

void appendBigEndian(std::vector<std::uint8_t>& out, std::uint64_t v, std::size_t count) {
  std::uint8_t bytes[8];
  for (std::size_t i = 0; i < count; ++i) bytes[i] = static_cast<std::uint8_t>(v >> (8 * (count - 1 - i)));
  out.insert(out.end(), bytes, bytes + count);
}

void appendForm(std::vector<std::uint8_t>& out, std::uint8_t lead, std::uint64_t v, std::size_t count) {
  std::uint8_t bytes[9] = {lead};
  for (std::size_t i = 0; i < count; ++i) bytes[i + 1] = static_cast<std::uint8_t>(v >> (8 * (count - 1 - i)));
  out.insert(out.end(), bytes, bytes + count + 1);
}

// A length or count in one, two or four bytes; the three leads follow one another.
void appendCount(std::vector<std::uint8_t>& out, std::uint8_t lead, bool hasShortest, std::size_t count) {
  if (hasShortest && count <= 0xff) {
    appendForm(out, lead, count, 1);
  } else if (count <= 0xffff) {
    appendForm(out, static_cast<std::uint8_t>(lead + (hasShortest ? 1 : 0)), count, 2);
  } else {
    appendForm(out, static_cast<std::uint8_t>(lead + (hasShortest ? 2 : 1)), count, 4);
  }
}

}  // namespace

void MessagePackWriter::nil() {
  _out.push_back(0xc0);
}

void MessagePackWriter::boolean(bool v) {
  _out.push_back(v ? 0xc3 : 0xc2);
}

void MessagePackWriter::integer(std::int64_t v) {
  if (v >= 0) {
    unsignedInteger(static_cast<std::uint64_t>(v));
  } else if (v >= -32) {
    _out.push_back(static_cast<std::uint8_t>(v));
  } else if (v >= std::numeric_limits<std::int8_t>::min()) {
    appendForm(_out, 0xd0, static_cast<std::uint64_t>(v), 1);
  } else if (v >= std::numeric_limits<std::int16_t>::min()) {
    appendForm(_out, 0xd1, static_cast<std::uint64_t>(v), 2);
  } else if (v >= std::numeric_limits<std::int32_t>::min()) {
    appendForm(_out, 0xd2, static_cast<std::uint64_t>(v), 4);
  } else {
    appendForm(_out, 0xd3, static_cast<std::uint64_t>(v), 8);
  }
}

void MessagePackWriter::unsignedInteger(std::uint64_t v) {
  if (v < 0x80) {
    _out.push_back(static_cast<std::uint8_t>(v));
  } else if (v <= 0xff) {
    appendForm(_out, 0xcc, v, 1);
  } else if (v <= 0xffff) {
    appendForm(_out, 0xcd, v, 2);
  } else if (v <= 0xffffffff) {
    appendForm(_out, 0xce, v, 4);
  } else {
    appendForm(_out, 0xcf, v, 8);
  }
}

void MessagePackWriter::real(double v) {
  appendForm(_out, 0xcb, std::bit_cast<std::uint64_t>(v), 8);
}

void MessagePackWriter::string(std::string_view v) {
  if (v.size() < 32) {
    _out.push_back(static_cast<std::uint8_t>(0xa0 | v.size()));
  } else {
    appendCount(_out, 0xd9, true, v.size());
  }
  _out.insert(_out.end(), v.begin(), v.end());
}

void MessagePackWriter::data(std::span<const std::uint8_t> v) {
  appendCount(_out, 0xc4, true, v.size());
  _out.insert(_out.end(), v.begin(), v.end());
}

void MessagePackWriter::date(double secondsSince1970) {
  // A date that no timestamp can hold becomes the nearest one that a timestamp can.
  double whole = std::floor(secondsSince1970);
  if (std::isnan(whole)) whole = 0;
  auto nanoseconds =
      static_cast<std::int64_t>(std::isfinite(secondsSince1970) ? std::llround((secondsSince1970 - whole) * 1e9) : 0);
  auto seconds = std::int64_t{0};
  if (whole >= 0x1p63) {
    seconds = std::numeric_limits<std::int64_t>::max();
  } else if (whole <= -0x1p63) {
    seconds = std::numeric_limits<std::int64_t>::min();
  } else {
    seconds = static_cast<std::int64_t>(whole);
  }
  if (nanoseconds >= 1'000'000'000) {
    nanoseconds = 0;
    if (seconds < std::numeric_limits<std::int64_t>::max()) ++seconds;
  }

  const auto type = static_cast<std::uint8_t>(-1);
  if (nanoseconds == 0 && seconds >= 0 && seconds <= 0xffffffffLL) {
    _out.insert(_out.end(), {0xd6, type});
    appendBigEndian(_out, static_cast<std::uint64_t>(seconds), 4);
  } else if (seconds >= 0 && seconds <= 0x3ffffffffLL) {
    _out.insert(_out.end(), {0xd7, type});
    appendBigEndian(_out, static_cast<std::uint64_t>(nanoseconds) << 34U | static_cast<std::uint64_t>(seconds), 8);
  } else {
    _out.insert(_out.end(), {0xc7, 12, type});
    appendBigEndian(_out, static_cast<std::uint64_t>(nanoseconds), 4);
    appendBigEndian(_out, static_cast<std::uint64_t>(seconds), 8);
  }
}

void MessagePackWriter::arrayHeader(std::size_t count) {
  if (count < 16) {
    _out.push_back(static_cast<std::uint8_t>(0x90 | count));
  } else {
    appendCount(_out, 0xdc, false, count);
  }
}

void MessagePackWriter::mapHeader(std::size_t count) {
  if (count < 16) {
    _out.push_back(static_cast<std::uint8_t>(0x80 | count));
  } else {
    appendCount(_out, 0xde, false, count);
  }
}

void MessagePackWriter::value(const Value& v) {
  struct Visitor {
    MessagePackWriter& writer;
    void operator()(std::monostate) const { writer.nil(); }
    void operator()(bool x) const { writer.boolean(x); }
    void operator()(std::int64_t x) const { writer.integer(x); }
    void operator()(std::uint64_t x) const { writer.unsignedInteger(x); }
    void operator()(double x) const { writer.real(x); }
    void operator()(const std::string& x) const { writer.string(x); }
    void operator()(const Data& x) const { writer.data(x.bytes); }
    void operator()(Date x) const { writer.date(x.secondsSince1970); }
    void operator()(const Array& x) const { writer.array(x); }
    void operator()(const Dictionary& x) const { writer.dictionary(x); }
  };
  std::visit(Visitor{*this}, v.storage());
}

void MessagePackWriter::dictionary(const Dictionary& v) {
  mapHeader(v.size());
  for (const auto& [key, element] : v) {
    string(key);
    value(element);
  }
}

void MessagePackWriter::array(const Array& v) {
  arrayHeader(v.size());
  for (const Value& element : v) value(element);
}

Result<Value> decodeMessagePack(std::span<const std::uint8_t> bytes, const MessagePackLimits& limits) {
  MessagePackReader reader(bytes, limits);
  Value value;
  if (!reader.value(value)) {
    if (!reader.failure().empty()) return Failure{reader.failure()};
    return Failure{fmt::format("truncated: the value goes on after the last of {} bytes", bytes.size())};
  }
  if (!reader.atEnd()) return Failure{fmt::format("bytes behind the value at byte {}", reader.offset())};
  if (auto& refusal = reader.refusal()) return Failure{std::move(*refusal)};
  return value;
}

}  // namespace orvanta::platform
