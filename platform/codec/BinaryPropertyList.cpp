#include <algorithm>
#include <bit>
#include <cmath>
#include <new>
#include <utility>

#include <fmt/format.h>

#include "platform/codec/BinaryPropertyListFormat.h"
#include "platform/codec/PropertyList.h"
#include "platform/core/Utf8.h"

namespace orvanta::platform {

namespace {

using namespace binary_property_list;

// Turns the objects of one document into values, following references from the top object. Errors end the walk; the
// first one is kept.
class BinaryReader {
 public:
  BinaryReader(std::span<const std::uint8_t> bytes, const PropertyListLimits& limits)
      : _bytes(bytes), _limits(limits) {}

  std::optional<Value> document() {
    if (_bytes.size() < kMagic.size() + kTrailerSize)
      return fail(_bytes.size(), "too short for a binary property list");
    if (!std::equal(kMagic.begin(), kMagic.end(), _bytes.begin())) return fail(0, "not a \"bplist00\"");
    const std::size_t trailer = _bytes.size() - kTrailerSize;
    _offsetSize = _bytes[trailer + kOffsetSizeAt];
    _referenceSize = _bytes[trailer + kReferenceSizeAt];
    _objectCount = number(trailer + kObjectCountAt, 8);
    const std::uint64_t top = number(trailer + kTopObjectAt, 8);
    const std::uint64_t table = number(trailer + kOffsetTableAt, 8);
    if (_offsetSize < 1 || _offsetSize > 8) return fail(trailer + kOffsetSizeAt, "an offset size other than 1 to 8");
    if (_referenceSize < 1 || _referenceSize > 8) {
      return fail(trailer + kReferenceSizeAt, "a reference size other than 1 to 8");
    }
    if (table < kMagic.size() || table > trailer || _objectCount > (trailer - table) / _offsetSize) {
      return fail(trailer + kObjectCountAt, "an offset table outside the file");
    }
    if (top >= _objectCount) return fail(trailer + kTopObjectAt, "a top object that is not there");
    _tableOffset = static_cast<std::size_t>(table);
    if (!countObjects(trailer, 1)) return std::nullopt;
    return object(top, trailer + kTopObjectAt);
  }

  const std::string& error() const { return _error; }

 private:
  // Where an object is, what kind, and where and how long its content is.
  struct Head {
    std::size_t offset = 0;
    std::uint8_t kind = 0;  // the high half of the marker
    std::uint8_t low = 0;   // the low half
    std::size_t content = 0;
    std::uint64_t count = 0;  // for kinds that have one
  };

  std::nullopt_t fail(std::size_t offset, std::string_view what) {
    if (_error.empty()) _error = fmt::format("{} at byte {}", what, offset);
    return std::nullopt;
  }

  // Big-endian; the caller has checked that the bytes are there.
  std::uint64_t number(std::size_t offset, std::size_t size) const {
    std::uint64_t result = 0;
    for (std::size_t i = 0; i < size; ++i) result = result << 8U | _bytes[offset + i];
    return result;
  }

  bool countObjects(std::size_t offset, std::uint64_t count) {
    if (count <= _limits.maximumObjects - _objects) {
      _objects += count;
      return true;
    }
    fail(offset, fmt::format("more than {} values, shared ones counted each time,", _limits.maximumObjects));
    return false;
  }

  bool countContent(std::size_t offset, std::uint64_t size) {
    if (size <= _limits.maximumBytes - _content) {
      _content += size;
      return true;
    }
    fail(offset,
         fmt::format("more than {} bytes of text and data, shared ones counted each time,", _limits.maximumBytes));
    return false;
  }

  // Returns whether `count` things of `size` bytes lie between `offset` and the offset table.
  bool fits(std::size_t offset, std::uint64_t count, std::size_t size) const {
    return offset <= _tableOffset && count <= (_tableOffset - offset) / size;
  }

  std::optional<Head> head(std::uint64_t reference, std::size_t from) {
    if (reference >= _objectCount)
      return fail(from, fmt::format("a reference to object {} of {}", reference, _objectCount));
    const std::size_t entry = _tableOffset + static_cast<std::size_t>(reference) * _offsetSize;
    const std::uint64_t offset = number(entry, _offsetSize);
    if (offset < kMagic.size() || offset >= _tableOffset) return fail(entry, "an offset outside the objects");
    Head result;
    result.offset = static_cast<std::size_t>(offset);
    result.kind = _bytes[result.offset] >> 4U;
    result.low = _bytes[result.offset] & 0x0fU;
    result.content = result.offset + 1;
    result.count = result.low;
    if (hasCount(result.kind) && result.low == kCountFollows && !longCount(result)) return std::nullopt;
    return result;
  }

  static bool hasCount(std::uint8_t kind) {
    return kind == kData || kind == kAscii || kind == kUtf16 || kind == kArray || kind == kOrderedSet || kind == kSet ||
           kind == kDictionary;
  }

  // A count of 15 and more is an integer object of its own behind the marker.
  bool longCount(Head& head) {
    const std::size_t marker = head.content;
    const bool isInteger = fits(marker, 1, 1) && _bytes[marker] >> 4U == kInteger && (_bytes[marker] & 0x0fU) <= 3;
    const std::size_t size = isInteger ? std::size_t{1} << (_bytes[marker] & 0x0fU) : 0;
    if (!isInteger || !fits(marker + 1, 1, size)) {
      fail(marker, "a count that is no integer");
      return false;
    }
    head.count = number(marker + 1, size);
    head.content = marker + 1 + size;
    return true;
  }

  std::optional<Value> object(std::uint64_t reference, std::size_t from) {
    const std::optional<Head> found = head(reference, from);
    if (!found) return std::nullopt;
    switch (found->kind) {
      case kSimple:
        return simple(*found);
      case kInteger:
        return integer(*found);
      case kReal:
        return real(*found);
      case kDate:
        return date(*found);
      case kData:
        return data(*found);
      case kAscii:
      case kUtf16: {
        std::optional<std::string> content = text(*found);
        if (!content) return std::nullopt;
        return Value(std::move(*content));
      }
      case kUid:
        return fail(found->offset, "a UID, which only keyed archives have,");
      case kArray:
      case kOrderedSet:
      case kSet:
      case kDictionary:
        return container(*found, reference);
      default:
        return fail(found->offset, fmt::format("an unknown object type {:#04x}", _bytes[found->offset]));
    }
  }

  std::optional<Value> simple(const Head& head) {
    switch (head.low) {
      case kNullMarker:
        return Value();
      case kFalseMarker:
        return Value(false);
      case kTrueMarker:
        return Value(true);
      default:
        return fail(head.offset, fmt::format("an unknown object type {:#04x}", _bytes[head.offset]));
    }
  }

  std::optional<Value> integer(const Head& head) {
    if (head.low > 4) return fail(head.offset, "an integer of more than 16 bytes");
    const std::size_t size = std::size_t{1} << head.low;
    if (!fits(head.content, 1, size)) return fail(head.offset, "an integer that ends too late");
    // Up to four bytes are unsigned, eight are signed; sixteen are signed too and hold what is larger.
    if (size < 8) return Value(number(head.content, size));
    const std::uint64_t low = number(head.content + size - 8, 8);
    if (size == 8) return Value(static_cast<std::int64_t>(low));
    const std::uint64_t high = number(head.content, 8);
    if (high == 0) return Value(low);
    if (high == ~std::uint64_t{0} && static_cast<std::int64_t>(low) < 0) return Value(static_cast<std::int64_t>(low));
    return fail(head.offset, "an integer that takes more than 64 bits");
  }

  std::optional<Value> real(const Head& head) {
    if (head.low != 2 && head.low != 3) return fail(head.offset, "a real number of other than 4 or 8 bytes");
    const std::size_t size = std::size_t{1} << head.low;
    if (!fits(head.content, 1, size)) return fail(head.offset, "a real number that ends too late");
    const std::uint64_t bits = number(head.content, size);
    if (size == 8) return Value(std::bit_cast<double>(bits));
    return Value(static_cast<double>(std::bit_cast<float>(static_cast<std::uint32_t>(bits))));
  }

  std::optional<Value> date(const Head& head) {
    if (head.low != 3 || !fits(head.content, 1, 8)) return fail(head.offset, "a date of other than 8 bytes");
    const auto seconds = std::bit_cast<double>(number(head.content, 8));
    if (!std::isfinite(seconds)) return fail(head.offset, "a date that is no finite number");
    return Value(Date{seconds + kEpochOffset});
  }

  std::optional<Value> data(const Head& head) {
    if (!fits(head.content, head.count, 1)) return fail(head.offset, "data that ends too late");
    if (!countContent(head.offset, head.count)) return std::nullopt;
    const std::uint8_t* begin = _bytes.data() + head.content;
    return Value(Data{{begin, begin + head.count}});
  }

  std::optional<std::string> text(const Head& head) {
    const std::size_t unit = head.kind == kAscii ? 1 : 2;
    if (!fits(head.content, head.count, unit)) return fail(head.offset, "text that ends too late");
    // A UTF-16 unit becomes up to three bytes.
    if (!countContent(head.offset, head.kind == kAscii ? head.count : head.count * 3)) return std::nullopt;
    if (head.kind == kUtf16) return utf16(head);
    std::string content(reinterpret_cast<const char*>(_bytes.data() + head.content), head.count);
    const auto isHigh = [](char c) { return (static_cast<unsigned char>(c) & 0x80U) != 0; };
    if (std::any_of(content.begin(), content.end(), isHigh)) return fail(head.offset, "ASCII text with other bytes");
    return content;
  }

  std::optional<std::string> utf16(const Head& head) {
    std::string content;
    content.reserve(head.count);
    for (std::uint64_t i = 0; i < head.count; ++i) {
      const std::size_t offset = head.content + 2 * i;
      auto codePoint = static_cast<char32_t>(number(offset, 2));
      if (codePoint >= 0xdc00 && codePoint <= 0xdfff) return fail(offset, "a low surrogate without a high one");
      if (codePoint >= 0xd800 && codePoint <= 0xdbff) {
        const auto low = i + 1 < head.count ? static_cast<char32_t>(number(offset + 2, 2)) : 0;
        if (low < 0xdc00 || low > 0xdfff) return fail(offset, "a high surrogate without a low one");
        codePoint = 0x10000 + ((codePoint - 0xd800) << 10U) + (low - 0xdc00);
        ++i;
      }
      appendUtf8(content, codePoint);
    }
    return content;
  }

  std::optional<Value> container(const Head& head, std::uint64_t reference) {
    if (std::find(_open.begin(), _open.end(), reference) != _open.end()) {
      return fail(head.offset, "an object that contains itself");
    }
    if (_open.size() >= _limits.maximumDepth) {
      return fail(head.offset, fmt::format("nesting deeper than {}", _limits.maximumDepth));
    }
    const std::size_t perElement = head.kind == kDictionary ? 2 * _referenceSize : _referenceSize;
    if (!fits(head.content, head.count, perElement)) return fail(head.offset, "references that end too late");
    if (!countObjects(head.offset, head.count)) return std::nullopt;
    _open.push_back(reference);
    std::optional<Value> result = head.kind == kDictionary ? dictionary(head) : array(head);
    _open.pop_back();
    return result;
  }

  std::optional<Value> array(const Head& head) {
    Array elements;
    elements.reserve(head.count);
    for (std::uint64_t i = 0; i < head.count; ++i) {
      const std::size_t at = head.content + static_cast<std::size_t>(i) * _referenceSize;
      std::optional<Value> element = object(number(at, _referenceSize), at);
      if (!element) return std::nullopt;
      elements.push_back(std::move(*element));
    }
    return Value(std::move(elements));
  }

  std::optional<Value> dictionary(const Head& head) {
    std::vector<Dictionary::Entry> entries;
    entries.reserve(head.count);
    for (std::uint64_t i = 0; i < head.count; ++i) {
      const std::size_t keyAt = head.content + static_cast<std::size_t>(i) * _referenceSize;
      const std::size_t valueAt = keyAt + static_cast<std::size_t>(head.count) * _referenceSize;
      const std::optional<Head> keyHead = this->head(number(keyAt, _referenceSize), keyAt);
      if (!keyHead) return std::nullopt;
      if (keyHead->kind != kAscii && keyHead->kind != kUtf16) return fail(keyHead->offset, "a key that is no text");
      std::optional<std::string> key = text(*keyHead);
      if (!key) return std::nullopt;
      std::optional<Value> element = object(number(valueAt, _referenceSize), valueAt);
      if (!element) return std::nullopt;
      entries.emplace_back(std::move(*key), std::move(*element));
    }
    std::optional<Dictionary> result = Dictionary::fromUniqueEntries(std::move(entries));
    if (!result) return fail(head.offset, "a dictionary with the same key twice");
    return Value(std::move(*result));
  }

  const std::span<const std::uint8_t> _bytes;
  const PropertyListLimits& _limits;
  std::size_t _offsetSize = 0;
  std::size_t _referenceSize = 0;
  std::uint64_t _objectCount = 0;
  std::size_t _tableOffset = 0;
  std::vector<std::uint64_t> _open;  // containers around the current object
  std::uint64_t _objects = 0;        // given out so far
  std::uint64_t _content = 0;        // bytes of text and data given out so far
  std::string _error;
};

}  // namespace

Result<Value> parseBinaryPropertyList(std::span<const std::uint8_t> bytes, const PropertyListLimits& limits) {
  if (bytes.size() > limits.maximumBytes) {
    return Failure{fmt::format("a property list of more than {} bytes", limits.maximumBytes)};
  }
  try {
    BinaryReader reader(bytes, limits);
    if (std::optional<Value> value = reader.document()) return std::move(*value);
    return Failure{reader.error()};
  } catch (const std::bad_alloc&) {
    return Failure{"no memory for the property list"};
  }
}

}  // namespace orvanta::platform
