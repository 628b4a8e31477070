#include <rapidjson/error/en.h>
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>

#include <charconv>
#include <cmath>
#include <cstdint>
#include <optional>
#include <utility>
#include <vector>

#include <fmt/format.h>

#include "platform/codec/Json.h"

namespace orvanta::platform {

namespace {

constexpr std::size_t kMaximumDepth = 64;

template <class Number>
std::optional<Value> readAs(std::string_view text) {
  Number number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return Value(number);
}

// A text that is a JSON number.
std::optional<Value> parseNumber(std::string_view text) {
  std::optional<Value> number;
  if (text.find_first_of(".eE") == text.npos) number = readAs<std::int64_t>(text);
  if (!number) number = readAs<std::uint64_t>(text);
  if (!number) number = readAs<double>(text);
  if (number) return number;
  // Out of a double's range: too small is as good as zero.
  const double nearest = Value(text).doubleValue();
  if (std::isinf(nearest)) return std::nullopt;
  return Value(nearest);
}

// Puts values together from the reader's events. An event that returns false ends the reading; `problem()` then says
// why.
class JsonBuilder {
 public:
  bool Null() { return put(Value()); }
  bool Bool(bool v) { return put(v); }
  bool RawNumber(const char* text, rapidjson::SizeType length, bool) {
    if (std::optional<Value> number = parseNumber({text, length})) return put(std::move(*number));
    _problem = "A number too big for a double";
    return false;
  }
  // The reader gives numbers as text, so these never come.
  bool Int(int) { return false; }
  bool Uint(unsigned) { return false; }
  bool Int64(std::int64_t) { return false; }
  bool Uint64(std::uint64_t) { return false; }
  bool Double(double) { return false; }
  bool String(const char* text, rapidjson::SizeType length, bool) { return put(std::string_view(text, length)); }
  bool Key(const char* text, rapidjson::SizeType length, bool) {
    _open.back().entries.emplace_back(std::string(text, length), Value());
    return true;
  }
  bool StartArray() { return open(false); }
  bool StartObject() { return open(true); }
  bool EndArray(rapidjson::SizeType) {
    Array elements = std::move(_open.back().elements);
    _open.pop_back();
    return put(std::move(elements));
  }
  bool EndObject(rapidjson::SizeType) {
    auto dictionary = Dictionary::fromUniqueEntries(std::move(_open.back().entries));
    if (!dictionary) {
      _problem = "An object with the same key twice";
      return false;
    }
    _open.pop_back();
    return put(std::move(*dictionary));
  }

  const char* problem() const { return _problem; }
  Value takeResult() { return std::move(_result); }

 private:
  struct Container {
    bool isObject = false;
    Array elements;
    std::vector<Dictionary::Entry> entries;  // the last one's value is still to come, or just came
  };

  bool open(bool isObject) {
    if (_open.size() >= kMaximumDepth) {
      _problem = "Nesting deeper than 64";
      return false;
    }
    _open.emplace_back().isObject = isObject;
    return true;
  }

  bool put(Value value) {
    if (_open.empty()) {
      _result = std::move(value);
    } else if (_open.back().isObject) {
      _open.back().entries.back().second = std::move(value);
    } else {
      _open.back().elements.push_back(std::move(value));
    }
    return true;
  }

  std::vector<Container> _open;
  Value _result;
  const char* _problem = nullptr;
};

}  // namespace

Result<Value> parseJson(std::string_view text) {
  // Iterative, so that hostile nesting costs no stack. Numbers as text, since the reader's own conversion is either not
  // exact or, for zeros with many digits, undefined.
  constexpr unsigned kFlags =
      rapidjson::kParseIterativeFlag | rapidjson::kParseNumbersAsStringsFlag | rapidjson::kParseValidateEncodingFlag;
  rapidjson::MemoryStream stream(text.data(), text.size());
  rapidjson::Reader reader;
  JsonBuilder builder;
  const rapidjson::ParseResult result = reader.Parse<kFlags>(stream, builder);
  if (result.IsError()) {
    const char* what = builder.problem() != nullptr ? builder.problem() : rapidjson::GetParseError_En(result.Code());
    return Failure{fmt::format("{} (at byte {})", what, result.Offset())};
  }
  // The reader takes a zero byte for the end.
  if (stream.Tell() != text.size()) return Failure{fmt::format("A zero byte (at byte {})", stream.Tell())};
  return builder.takeResult();
}

}  // namespace orvanta::platform
