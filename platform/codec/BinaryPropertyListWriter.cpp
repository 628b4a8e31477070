#include <algorithm>
#include <bit>
#include <cmath>
#include <limits>
#include <unordered_map>

#include "platform/codec/BinaryPropertyListFormat.h"
#include "platform/codec/PropertyList.h"
#include "platform/core/Utf8.h"

namespace orvanta::platform {

namespace {

using namespace binary_property_list;

std::size_t bytesFor(std::uint64_t v) {
  return v <= 0xff ? 1 : v <= 0xffff ? 2 : v <= 0xffffffff ? 4 : 8;
}

// Numbers the objects in a first pass, texts that are equal as one, and writes them in a second, when it is known how
// wide a reference is. After a false `problem()` says what could not be written.
class BinaryWriter {
 public:
  bool collect(const Value& value, std::size_t& reference) {
    if (const std::string* text = value.string()) return collectText(*text, reference);
    reference = _objects.size();
    _objects.push_back({&value, nullptr, {}});
    std::vector<std::size_t> references;
    if (const Array* array = value.array()) {
      references.reserve(array->size());
      for (const Value& element : *array) {
        if (!collect(element, references.emplace_back())) return false;
      }
    } else if (const Dictionary* dictionary = value.dictionary()) {
      references.reserve(2 * dictionary->size());
      for (const auto& entry : *dictionary) {
        if (!collectText(entry.first, references.emplace_back())) return false;
      }
      for (const auto& entry : *dictionary) {
        if (!collect(entry.second, references.emplace_back())) return false;
      }
    } else if (value.isNull()) {
      return fail("null has no form in a property list");
    } else if (const Date* date = value.date(); date != nullptr && !std::isfinite(date->secondsSince1970)) {
      return fail("a date that is no finite number");
    }
    _objects[reference].references = std::move(references);
    return true;
  }

  std::vector<std::uint8_t> write() {
    _referenceSize = bytesFor(_objects.size() - 1);
    _out.assign(kMagic.begin(), kMagic.end());
    std::vector<std::uint64_t> offsets;
    offsets.reserve(_objects.size());
    for (const Object& object : _objects) {
      offsets.push_back(_out.size());
      append(object);
    }
    const std::uint64_t table = _out.size();
    const std::size_t offsetSize = bytesFor(table);
    for (const std::uint64_t offset : offsets) appendNumber(offset, offsetSize);
    _out.insert(_out.end(), kOffsetSizeAt, 0);
    _out.push_back(static_cast<std::uint8_t>(offsetSize));
    _out.push_back(static_cast<std::uint8_t>(_referenceSize));
    appendNumber(_objects.size(), 8);
    appendNumber(0, 8);
    appendNumber(table, 8);
    return std::move(_out);
  }

  const char* problem() const { return _problem; }

 private:
  struct Object {
    const Value* value = nullptr;
    const std::string* text = nullptr;    // instead of a value
    std::vector<std::size_t> references;  // a dictionary's keys first, then its values
  };

  bool fail(const char* problem) {
    _problem = problem;
    return false;
  }

  bool collectText(const std::string& text, std::size_t& reference) {
    const auto [known, isNew] = _texts.try_emplace(text, _objects.size());
    reference = known->second;
    if (!isNew) return true;
    if (!isValidUtf8(text)) return fail("text that is not UTF-8");
    _objects.push_back({nullptr, &text, {}});
    return true;
  }

  void append(const Object& object) {
    if (object.text != nullptr) return write(*object.text);
    if (const Array* array = object.value->array()) {
      appendCount(kArray, array->size());
    } else if (const Dictionary* dictionary = object.value->dictionary()) {
      appendCount(kDictionary, dictionary->size());
    } else {
      return std::visit([this](const auto& v) { write(v); }, object.value->storage());
    }
    for (const std::size_t reference : object.references) appendNumber(reference, _referenceSize);
  }

  void write(std::monostate) { appendMarker(kSimple, kNullMarker); }
  void write(bool v) { appendMarker(kSimple, v ? kTrueMarker : kFalseMarker); }
  void write(std::int64_t v) {
    if (v < 0) {
      appendMarker(kInteger, 3);
      appendNumber(static_cast<std::uint64_t>(v), 8);
    } else {
      appendSmall(static_cast<std::uint64_t>(v));
    }
  }
  void write(std::uint64_t v) {
    if (v <= static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max())) return appendSmall(v);
    // Eight bytes would read as a negative number.
    appendMarker(kInteger, 4);
    appendNumber(0, 8);
    appendNumber(v, 8);
  }
  void write(double v) {
    appendMarker(kReal, 3);
    appendNumber(std::bit_cast<std::uint64_t>(v), 8);
  }
  void write(Date v) {
    appendMarker(kDate, 3);
    appendNumber(std::bit_cast<std::uint64_t>(v.secondsSince1970 - kEpochOffset), 8);
  }
  void write(const Data& v) {
    appendCount(kData, v.bytes.size());
    _out.insert(_out.end(), v.bytes.begin(), v.bytes.end());
  }
  void write(const std::string& v) {
    const auto isAscii = [](char c) { return static_cast<unsigned char>(c) < 0x80; };
    if (std::all_of(v.begin(), v.end(), isAscii)) {
      appendCount(kAscii, v.size());
      _out.insert(_out.end(), v.begin(), v.end());
      return;
    }
    std::vector<std::uint16_t> units;
    for (std::string_view rest = v; !rest.empty();) {
      const Utf8Character character = firstUtf8Character(rest);
      rest.remove_prefix(character.length);
      if (character.codePoint < 0x10000) {
        units.push_back(static_cast<std::uint16_t>(character.codePoint));
      } else {
        const char32_t offset = character.codePoint - 0x10000;
        units.push_back(static_cast<std::uint16_t>(0xd800 + (offset >> 10U)));
        units.push_back(static_cast<std::uint16_t>(0xdc00 + (offset & 0x3ffU)));
      }
    }
    appendCount(kUtf16, units.size());
    for (const std::uint16_t unit : units) appendNumber(unit, 2);
  }
  void write(const Array&) {}  // append() writes their references
  void write(const Dictionary&) {}

  void appendNumber(std::uint64_t v, std::size_t size) {
    for (std::size_t i = size; i-- > 0;) _out.push_back(static_cast<std::uint8_t>(v >> (8 * i)));
  }
  void appendMarker(std::uint8_t kind, std::uint8_t low) {
    _out.push_back(static_cast<std::uint8_t>(kind << 4U | low));
  }
  void appendSmall(std::uint64_t v) {
    const std::size_t size = bytesFor(v);
    appendMarker(kInteger, static_cast<std::uint8_t>(std::countr_zero(size)));
    appendNumber(v, size);
  }
  void appendCount(std::uint8_t kind, std::size_t count) {
    if (count < kCountFollows) return appendMarker(kind, static_cast<std::uint8_t>(count));
    appendMarker(kind, kCountFollows);
    appendSmall(count);
  }

  std::vector<Object> _objects;
  std::unordered_map<std::string_view, std::size_t> _texts;
  std::size_t _referenceSize = 1;
  std::vector<std::uint8_t> _out;
  const char* _problem = nullptr;
};

}  // namespace

Result<std::vector<std::uint8_t>> writeBinaryPropertyList(const Value& value) {
  BinaryWriter writer;
  std::size_t top = 0;
  if (!writer.collect(value, top)) return Failure{writer.problem()};
  return writer.write();
}

}  // namespace orvanta::platform
