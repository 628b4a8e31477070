#include "platform/codec/MessagePackReader.h"

#include <bit>
#include <utility>

#include <fmt/format.h>

#include "platform/core/Utf8.h"

namespace orvanta::platform {

namespace {

using Kind = MessagePackHead::Kind;

constexpr std::int8_t kTimestampType = -1;
constexpr std::uint64_t kNanosecondsPerSecond = 1'000'000'000;
constexpr std::size_t kMaximumKeyInText = 64;

}  // namespace

bool MessagePackReader::fail(std::size_t offset, std::string_view what) {
  _failure = fmt::format("{} at byte {}", what, offset);
  return false;
}

void MessagePackReader::refuse(std::size_t offset, std::string_view what) {
  if (!_refusal) _refusal = fmt::format("{} at byte {}", what, offset);
}

bool MessagePackReader::failCharge() {
  return fail(_offset, fmt::format("values that take more than {} bytes in memory", _limits.maximumCharge));
}

bool MessagePackReader::failInvalid() {
  return fail(_offset, "a byte that begins no MessagePack value");
}

bool MessagePackReader::enter(const MessagePackHead& head) {
  if (_depth >= _limits.maximumDepth) {
    return fail(_offset - head.size, fmt::format("nesting deeper than {}", _limits.maximumDepth));
  }
  ++_depth;
  _owed += head.elements();
  return _owed <= left();
}

bool MessagePackReader::text(const MessagePackHead& head, std::string_view& text) {
  if (head.argument > left()) return false;
  text = {reinterpret_cast<const char*>(here()), static_cast<std::size_t>(head.argument)};
  if (!isValidUtf8(text)) {
    refuse(_offset, "text that is not UTF-8");
    text = {};
  }
  _offset += head.argument;
  return true;
}

bool MessagePackReader::value(Value& out) {
  MessagePackHead next;
  return head(next) && valueAfter(next, out);
}

bool MessagePackReader::valueAfter(const MessagePackHead& head, Value& out) {
  switch (head.kind) {
    case Kind::nil:
      return true;
    case Kind::boolean:
      out.storage() = head.argument != 0;
      return true;
    case Kind::integer:
      out.storage() = static_cast<std::int64_t>(head.argument);
      return true;
    case Kind::unsignedInteger:
      if (std::in_range<std::int64_t>(head.argument)) {
        out.storage() = static_cast<std::int64_t>(head.argument);
      } else {
        out.storage() = head.argument;
      }
      return true;
    case Kind::real:
      out.storage() = std::bit_cast<double>(head.argument);
      return true;
    case Kind::shortReal:
      refuse(_offset - head.size, "a float32, where numbers with a fraction are float64,");
      return true;
    case Kind::string: {
      std::string_view content;
      if (!text(head, content)) return false;
      out.storage().emplace<std::string>(content);
      return true;
    }
    case Kind::data: {
      if (head.argument > left()) return false;
      const auto size = static_cast<std::size_t>(head.argument);
      out.storage().emplace<Data>().bytes.assign(here(), here() + size);
      _offset += size;
      return true;
    }
    case Kind::array:
      return array(head, out.storage().emplace<Array>());
    case Kind::map:
      return map(head, out);
    case Kind::extension:
      return extension(head, out);
    case Kind::invalid:
    case Kind::truncated:
      break;
  }
  return false;
}

bool MessagePackReader::array(const MessagePackHead& head, Array& out) {
  if (!enter(head)) return false;
  out.reserve(head.argument);  // a byte is there for each of them
  for (std::uint64_t i = 0; i < head.argument; ++i) {
    if (!value(out.emplace_back())) return false;
  }
  leave();
  return true;
}

bool MessagePackReader::map(const MessagePackHead& head, Value& out) {
  const std::size_t start = _offset - head.size;
  if (!enter(head)) return false;
  std::vector<Dictionary::Entry> entries;
  entries.reserve(head.argument);  // two bytes are there for each of them
  for (std::uint64_t i = 0; i < head.argument; ++i) {
    if (!mapEntry(entries.emplace_back())) return false;
  }
  leave();
  if (auto dictionary = Dictionary::fromUniqueEntries(std::move(entries))) {
    out.storage() = std::move(*dictionary);
  } else if (!_refusal) {
    refuseDuplicate(start, entries);  // NOLINT(bugprone-use-after-move): on failure nothing was taken
  }
  return true;
}

bool MessagePackReader::mapEntry(Dictionary::Entry& entry) {
  const std::size_t start = _offset;
  MessagePackHead keyHead;
  if (!head(keyHead)) return false;
  if (keyHead.kind == Kind::string) {
    std::string_view key;
    if (!text(keyHead, key)) return false;
    entry.first.assign(key);
  } else {
    refuse(start, "a map key that is not text");
    Value ignored;
    if (!valueAfter(keyHead, ignored)) return false;
  }
  return value(entry.second);
}

bool MessagePackReader::extension(const MessagePackHead& head, Value& out) {
  if (head.argument > left()) return false;
  const std::size_t start = _offset - head.size;
  const std::uint8_t* body = here();
  _offset += head.argument;
  if (head.extensionType != kTimestampType) {
    refuse(start, fmt::format("extension type {}", head.extensionType));
    return true;
  }

  std::uint64_t nanoseconds = 0;
  std::int64_t seconds = 0;
  switch (head.argument) {
    case 4:
      seconds = static_cast<std::int64_t>(loadBigEndian(body, 4));
      break;
    case 8: {
      const std::uint64_t both = loadBigEndian(body, 8);
      nanoseconds = both >> 34U;
      seconds = static_cast<std::int64_t>(both & 0x3ffffffffU);
      break;
    }
    case 12:
      nanoseconds = loadBigEndian(body, 4);
      seconds = static_cast<std::int64_t>(loadBigEndian(body + 4, 8));
      break;
    default:
      refuse(start, fmt::format("a timestamp of {} bytes", head.argument));
      return true;
  }
  if (nanoseconds >= kNanosecondsPerSecond) {
    refuse(start, fmt::format("a timestamp with {} nanoseconds", nanoseconds));
    return true;
  }
  out.storage() = Date{static_cast<double>(seconds) + static_cast<double>(nanoseconds) * 1e-9};
  return true;
}

void MessagePackReader::refuseDuplicate(std::size_t offset, const std::vector<Dictionary::Entry>& entries) {
  Dictionary seen;
  for (const Dictionary::Entry& entry : entries) {
    if (seen.contains(entry.first)) {
      const std::string& key = entry.first;
      refuse(offset, key.size() <= kMaximumKeyInText ? fmt::format("a map with the key \"{}\" twice", key)
                                                     : "a map with a long key twice");
      return;
    }
    seen.set(entry.first, nullptr);
  }
}

}  // namespace orvanta::platform
