#include <algorithm>
#include <charconv>
#include <utility>

#include <fmt/format.h>

#include "platform/core/PropertyListDate.h"
#include "platform/core/Text.h"
#include "platform/core/Value.h"

namespace orvanta::platform {

namespace {

constexpr std::size_t kMaximumContainerText = 2048;  // a log line's worth
constexpr std::size_t kMaximumDataBytes = 64;
constexpr int kMaximumDepth = 16;
constexpr std::string_view kEllipsis = "…";

// Writes descriptions of nested values until the text is long enough for any reader.
class Describer {
 public:
  explicit Describer(std::string& out) : _out(out) {}

  void append(const Value& value, int depth) {
    std::visit([this, depth](const auto& v) { write(v, depth); }, value.storage());
  }

 private:
  bool full() const { return _out.size() >= kMaximumContainerText; }

  void write(std::monostate, int) { _out += "null"; }
  void write(bool v, int) { _out += v ? '1' : '0'; }
  void write(std::int64_t v, int) { fmt::format_to(std::back_inserter(_out), "{}", v); }
  void write(std::uint64_t v, int) { fmt::format_to(std::back_inserter(_out), "{}", v); }
  void write(double v, int) {
    char text[32];
    const auto [end, error] = std::to_chars(text, text + sizeof text, v);
    _out.append(text, end);
  }
  void write(const std::string& v, int depth) {
    if (depth == 0 || v.size() <= kMaximumContainerText) {
      _out += v;
      return;
    }
    std::size_t cut = kMaximumContainerText;
    while (cut > 0 && (static_cast<unsigned char>(v[cut]) & 0xc0U) == 0x80) --cut;  // not inside a character
    _out.append(v, 0, cut) += kEllipsis;
  }
  void write(const Data& v, int) {
    _out += '<';
    const std::size_t shown = std::min(v.bytes.size(), kMaximumDataBytes);
    _out += hexText(std::span(v.bytes).first(shown));
    if (shown < v.bytes.size()) _out += kEllipsis;
    _out += '>';
  }
  void write(Date v, int) { _out += describeDate(v.secondsSince1970); }
  void write(const Array& v, int depth) {
    list(v, depth, [this, depth](const Value& element) { append(element, depth + 1); });
  }
  void write(const Dictionary& v, int depth) {
    list(v, depth, [this, depth](const Dictionary::Entry& entry) {
      write(entry.first, depth + 1);
      _out += " = ";
      append(entry.second, depth + 1);
    });
  }

  template <class Container, class Write>
  void list(const Container& container, int depth, Write writeElement) {
    _out += '{';
    bool first = true;
    for (const auto& element : container) {
      if (!first) _out += ", ";
      if (full() || depth >= kMaximumDepth) {
        _out += kEllipsis;
        break;
      }
      first = false;
      writeElement(element);
    }
    _out += '}';
  }

  std::string& _out;
};

}  // namespace

std::string Value::description() const {
  std::string text;
  Describer(text).append(*this, 0);
  return text;
}

std::string describeDate(double secondsSince1970) {
  std::optional<std::string> text = formatPropertyListDate(secondsSince1970);
  if (!text) return fmt::format("{} s since 1970", secondsSince1970);
  text->replace(text->find('T'), 1, " ");
  text->replace(text->find('Z'), 1, " +0000");
  return std::move(*text);
}

}  // namespace orvanta::platform
