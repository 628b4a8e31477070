#include <charconv>
#include <cmath>

#include <fmt/format.h>

#include "platform/codec/PropertyList.h"
#include "platform/core/PropertyListDate.h"
#include "platform/core/Utf8.h"

namespace orvanta::platform {

namespace {

constexpr std::string_view kHead = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n";
constexpr std::string_view kTail = "</plist>\n";

// Writes values one element a line, indented by tabs. After a false `problem()` says what could not be written.
class XmlWriter {
 public:
  explicit XmlWriter(std::string& out) : _out(out) {}

  bool append(const Value& value) {
    return std::visit([this](const auto& v) { return write(v); }, value.storage());
  }
  const char* problem() const { return _problem; }

 private:
  bool fail(const char* problem) {
    _problem = problem;
    return false;
  }

  bool write(std::monostate) { return fail("null has no form in a property list"); }
  bool write(bool v) { return line(v ? "<true/>" : "<false/>"); }
  bool write(std::int64_t v) { return element("integer", fmt::format_int(v)); }
  bool write(std::uint64_t v) { return element("integer", fmt::format_int(v)); }
  bool write(double v) {
    if (std::isnan(v)) return element("real", "nan");
    if (std::isinf(v)) return element("real", v > 0 ? "+infinity" : "-infinity");
    char text[32];
    const auto [end, error] = std::to_chars(text, text + sizeof text, v);
    return element("real", std::string_view(text, static_cast<std::size_t>(end - text)));
  }
  bool write(const std::string& v) { return textElement("string", v); }
  bool write(const Data& v) { return element("data", encodeBase64(v.bytes)); }
  bool write(Date v) {
    const std::optional<std::string> text = formatPropertyListDate(v.secondsSince1970);
    return text ? element("date", *text) : fail("a date outside the years 1 to 9999");
  }
  bool write(const Array& v) {
    if (v.empty()) return line("<array/>");
    open("<array>");
    for (const Value& value : v) {
      if (!append(value)) return false;
    }
    return close("</array>");
  }
  bool write(const Dictionary& v) {
    if (v.empty()) return line("<dict/>");
    open("<dict>");
    for (const auto& [key, value] : v) {
      if (!textElement("key", key) || !append(value)) return false;
    }
    return close("</dict>");
  }

  std::string& indented() { return _out.append(_depth, '\t'); }
  bool line(std::string_view text) {
    (indented() += text) += '\n';
    return true;
  }
  void open(std::string_view tag) {
    line(tag);
    ++_depth;
  }
  bool close(std::string_view tag) {
    --_depth;
    return line(tag);
  }
  bool element(std::string_view name, const fmt::format_int& number) {
    return element(name, std::string_view(number.data(), number.size()));
  }
  bool element(std::string_view name, std::string_view content) {
    ((((((indented() += '<') += name) += '>') += content) += "</") += name) += ">\n";
    return true;
  }

  bool textElement(std::string_view name, std::string_view text) {
    if (findNonXmlCharacter(text)) return fail("text with characters that XML cannot carry");
    ((indented() += '<') += name) += '>';
    appendEscaped(text);
    ((_out += "</") += name) += ">\n";
    return true;
  }

  // A carriage return as such would be read back as a line feed.
  void appendEscaped(std::string_view text) {
    for (;;) {
      const std::size_t special = text.find_first_of("<>&\r");
      _out += text.substr(0, special);
      if (special == text.npos) return;
      const char c = text[special];
      _out += c == '<' ? "&lt;" : c == '>' ? "&gt;" : c == '&' ? "&amp;" : "&#13;";
      text.remove_prefix(special + 1);
    }
  }

  std::string& _out;
  std::size_t _depth = 0;
  const char* _problem = nullptr;
};

}  // namespace

Result<std::string> writeXmlPropertyList(const Value& value) {
  std::string out(kHead);
  XmlWriter writer(out);
  if (!writer.append(value)) return Failure{writer.problem()};
  out += kTail;
  return out;
}

}  // namespace orvanta::platform
