#include "platform/codec/Json.h"

#include <charconv>
#include <cmath>
#include <cstdint>
#include <cstring>

#include "platform/codec/PropertyList.h"
#include "platform/core/Text.h"

namespace orvanta::platform {

namespace {

constexpr std::string_view kReplacement = "\xef\xbf\xbd";  // U+FFFD
constexpr std::size_t kIndent = 2;

constexpr std::uint64_t everyByte(std::uint8_t b) {
  return 0x0101010101010101U * b;
}

// Bytes of the word with something to do: controls, quotes, backslashes, and what is not ASCII. May also be set for
// bytes above such a one.
std::uint64_t specialBytes(std::uint64_t word) {
  const auto zeroBytes = [](std::uint64_t w) { return (w - everyByte(1)) & ~w; };
  const std::uint64_t controls = (word - everyByte(0x20)) & ~word;
  return (controls | zeroBytes(word ^ everyByte('"')) | zeroBytes(word ^ everyByte('\\')) | word) & everyByte(0x80);
}

bool isSpecial(char c) {
  const auto byte = static_cast<unsigned char>(c);
  return byte < 0x20 || byte >= 0x80 || byte == '"' || byte == '\\';
}

// How many bytes from the start go out as they are.
std::size_t plainPrefix(std::string_view text) {
  std::size_t i = 0;
  for (; text.size() - i >= sizeof(std::uint64_t); i += sizeof(std::uint64_t)) {
    std::uint64_t word = 0;
    std::memcpy(&word, text.data() + i, sizeof word);
    if (specialBytes(word) != 0) break;
  }
  while (i < text.size() && !isSpecial(text[i])) ++i;
  return i;
}

void appendEscaped(std::string& out, char c) {
  switch (c) {
    case '"':
    case '\\':
      (out += '\\') += c;
      return;
    case '\b':
      out += "\\b";
      return;
    case '\f':
      out += "\\f";
      return;
    case '\n':
      out += "\\n";
      return;
    case '\r':
      out += "\\r";
      return;
    case '\t':
      out += "\\t";
      return;
    default:
      (out += "\\u00") += hexText({&c, 1});
  }
}

template <class Number>
void appendShortest(std::string& out, Number v) {
  char text[32];
  const auto [end, error] = std::to_chars(text, text + sizeof text, v);
  out.append(text, end);
}

class JsonWriter {
 public:
  JsonWriter(std::string& out, bool pretty) : _out(out), _pretty(pretty) {}

  void append(const Value& value) {
    std::visit([this](const auto& v) { write(v); }, value.storage());
  }

 private:
  void write(std::monostate) { _out += "null"; }
  void write(bool v) { _out += v ? "true" : "false"; }
  void write(std::int64_t v) { appendJsonNumber(_out, v); }
  void write(std::uint64_t v) { appendJsonNumber(_out, v); }
  void write(double v) {
    if (!appendJsonNumber(_out, v)) _out += "null";
  }
  void write(const std::string& v) { appendJsonString(_out, v); }
  void write(const Data& v) { ((_out += '"') += encodeBase64(v.bytes)) += '"'; }
  void write(Date v) { write(v.secondsSince1970); }
  void write(const Array& v) {
    list('[', ']', v, [this](const Value& element) { append(element); });
  }
  void write(const Dictionary& v) {
    list('{', '}', v, [this](const Dictionary::Entry& entry) {
      appendJsonString(_out, entry.first);
      _out += _pretty ? ": " : ":";
      append(entry.second);
    });
  }

  template <class Container, class Write>
  void list(char open, char close, const Container& container, Write writeElement) {
    _out += open;
    ++_depth;
    bool first = true;
    for (const auto& element : container) {
      if (!first) _out += ',';
      first = false;
      breakLine();
      writeElement(element);
    }
    --_depth;
    if (!first) breakLine();
    _out += close;
  }

  void breakLine() {
    if (_pretty) (_out += '\n').append(_depth * kIndent, ' ');
  }

  std::string& _out;
  const bool _pretty;
  std::size_t _depth = 0;
};

}  // namespace

std::string writeJson(const Value& value, bool pretty) {
  std::string out;
  JsonWriter(out, pretty).append(value);
  return out;
}

void appendJsonString(std::string& out, std::string_view text) {
  out += '"';
  for (;;) {
    const std::size_t plain = plainPrefix(text);
    out.append(text.data(), plain);
    text.remove_prefix(plain);
    if (text.empty()) break;
    const Utf8Character character = firstUtf8Character(text);
    if (!character.valid) {
      out += kReplacement;
    } else if (character.length > 1) {
      out.append(text.data(), character.length);
    } else {
      appendEscaped(out, text.front());
    }
    text.remove_prefix(character.length);
  }
  out += '"';
}

bool appendJsonNumber(std::string& out, double v) {
  if (!std::isfinite(v)) return false;
  appendShortest(out, v);
  if (v == 0 && std::signbit(v)) out += ".0";  // "-0" would be read back as the integer 0
  return true;
}

void appendJsonNumber(std::string& out, std::int64_t v) {
  appendShortest(out, v);
}
void appendJsonNumber(std::string& out, std::uint64_t v) {
  appendShortest(out, v);
}

}  // namespace orvanta::platform
