#include <algorithm>
#include <charconv>
#include <cmath>
#include <limits>
#include <new>
#include <utility>

#include <fmt/format.h>
#include <pugixml.hpp>

#include "platform/codec/PropertyList.h"
#include "platform/core/PropertyListDate.h"
#include "platform/core/Text.h"
#include "platform/core/Utf8.h"

namespace orvanta::platform {

namespace {

constexpr std::size_t kMaximumNameInText = 40;
constexpr std::string_view kWhiteSpace = " \t\n\r";

bool isBlank(std::string_view text) {
  return text.find_first_not_of(kWhiteSpace) == text.npos;
}

std::string_view trimmed(std::string_view text) {
  const std::size_t first = text.find_first_not_of(kWhiteSpace);
  if (first == text.npos) return {};
  return text.substr(first, text.find_last_not_of(kWhiteSpace) - first + 1);
}

// The text between "&" and ";". Nullopt unless it is predefined: a document's own entities are never looked up.
std::optional<char32_t> entity(std::string_view name) {
  if (name == "lt") return U'<';
  if (name == "gt") return U'>';
  if (name == "amp") return U'&';
  if (name == "apos") return U'\'';
  if (name == "quot") return U'"';
  if (!name.starts_with('#')) return std::nullopt;
  name.remove_prefix(1);
  int base = 10;
  if (name.starts_with('x')) {
    name.remove_prefix(1);
    base = 16;
  }
  std::uint32_t codePoint = 0;
  const auto [end, error] = std::from_chars(name.data(), name.data() + name.size(), codePoint, base);
  if (error != std::errc() || end != name.data() + name.size() || !isXmlCharacter(codePoint)) return std::nullopt;
  return codePoint;
}

// A number's sign, which from_chars takes only in part, and the rest.
std::pair<bool, std::string_view> splitSign(std::string_view text) {
  if (text.starts_with('-')) return {true, text.substr(1)};
  return {false, text.starts_with('+') ? text.substr(1) : text};
}

std::optional<Value> parseInteger(std::string_view text) {
  auto [negative, digits] = splitSign(text);
  int base = 10;
  if (digits.starts_with("0x") || digits.starts_with("0X")) {
    digits.remove_prefix(2);
    base = 16;
  }
  std::uint64_t magnitude = 0;
  const auto [end, error] = std::from_chars(digits.data(), digits.data() + digits.size(), magnitude, base);
  if (error != std::errc() || end != digits.data() + digits.size()) return std::nullopt;
  if (!negative) return Value(magnitude);
  constexpr std::uint64_t kMostNegative = std::uint64_t{1} << 63U;
  if (magnitude > kMostNegative) return std::nullopt;
  return Value(static_cast<std::int64_t>(0 - magnitude));
}

std::optional<Value> parseReal(std::string_view text) {
  auto [negative, digits] = splitSign(text);
  double magnitude = 0;
  if (equalsIgnoringCase(digits, "nan")) {
    magnitude = std::numeric_limits<double>::quiet_NaN();
  } else if (equalsIgnoringCase(digits, "inf") || equalsIgnoringCase(digits, "infinity")) {
    magnitude = std::numeric_limits<double>::infinity();
  } else {
    if (digits.starts_with('-')) return std::nullopt;
    const auto [end, error] = std::from_chars(digits.data(), digits.data() + digits.size(), magnitude);
    if (error != std::errc() || end != digits.data() + digits.size()) return std::nullopt;
    if (!std::isfinite(magnitude)) return std::nullopt;  // "nan(…)"
  }
  return Value(negative ? -magnitude : magnitude);
}

// Turns the tree of one document into values. Errors end the walk; the first one is kept.
class XmlReader {
 public:
  explicit XmlReader(const PropertyListLimits& limits) : _limits(limits) {}

  std::optional<Value> document(const pugi::xml_document& document) {
    pugi::xml_node root;
    for (const pugi::xml_node node : document.children()) {
      if (node.type() == pugi::node_declaration) {
        if (!checkEncoding(node)) return std::nullopt;
      } else if (!isIgnorable(node)) {
        if (node.type() != pugi::node_element) return fail(node, "text outside the root element");
        if (root) return fail(node, "a second root element");
        root = node;
      }
    }
    if (!root) return fail(document, "no root element");
    if (root.name() != std::string_view("plist")) {
      return fail(root, fmt::format("the root element is not \"plist\" but {}", quoted(root)));
    }
    const pugi::xml_node only = nextElement(root.first_child());
    if (failed()) return std::nullopt;
    if (!only) return fail(root, "a \"plist\" without a value");
    std::optional<Value> result = value(only, 0);
    if (!result) return std::nullopt;
    if (const pugi::xml_node second = nextElement(only.next_sibling()))
      return fail(second, "a second value in \"plist\"");
    if (failed()) return std::nullopt;
    return result;
  }

  const std::string& error() const { return _error; }

 private:
  std::nullopt_t fail(const pugi::xml_node& node, std::string_view what) {
    if (_error.empty()) _error = fmt::format("{} at byte {}", what, std::max<std::ptrdiff_t>(node.offset_debug(), 0));
    return std::nullopt;
  }
  bool failed() const { return !_error.empty(); }

  static std::string quoted(const pugi::xml_node& node) {
    const std::string_view name = node.name();
    return name.size() <= kMaximumNameInText ? fmt::format("\"{}\"", name) : "one with a long name";
  }

  // Other declarations could give bytes that happen to be UTF-8 another meaning.
  bool checkEncoding(const pugi::xml_node& declaration) {
    const std::string_view encoding = declaration.attribute("encoding").value();
    if (encoding.empty() || equalsIgnoringCase(encoding, "utf-8") || equalsIgnoringCase(encoding, "us-ascii"))
      return true;
    fail(declaration, "an encoding other than UTF-8");
    return false;
  }

  static bool isIgnorable(const pugi::xml_node& node) {
    return node.type() == pugi::node_pcdata && isBlank(node.value());
  }

  // The element at or behind `node` on its level; null when the level ends or (an error) text comes first.
  pugi::xml_node nextElement(pugi::xml_node node) {
    while (node && isIgnorable(node)) node = node.next_sibling();
    if (!node || node.type() == pugi::node_element) return node;
    fail(node, "text between elements");
    return {};
  }

  std::optional<Value> value(const pugi::xml_node& node, std::size_t depth) {
    if (++_objects > _limits.maximumObjects)
      return fail(node, fmt::format("more than {} values", _limits.maximumObjects));
    const std::string_view name = node.name();
    if (name == "string") {
      std::optional<std::string> content = text(node);
      if (!content) return std::nullopt;
      return Value(std::move(*content));
    }
    if (name == "dict" || name == "array") {
      if (depth >= _limits.maximumDepth) return fail(node, fmt::format("nesting deeper than {}", _limits.maximumDepth));
      return name == "dict" ? dictionary(node, depth + 1) : array(node, depth + 1);
    }
    if (name == "true" || name == "false") {
      if (node.first_child() && !isBlankElement(node)) return fail(node, fmt::format("content in {}", quoted(node)));
      return Value(name == "true");
    }
    if (name == "integer") return parsed(node, "an integer", parseInteger);
    if (name == "real") return parsed(node, "a real number", parseReal);
    if (name == "date")
      return parsed(node, "a date", [](std::string_view content) -> std::optional<Value> {
        if (const auto seconds = parsePropertyListDate(content)) return Date{*seconds};
        return std::nullopt;
      });
    if (name == "data")
      return parsed(node, "base64", [](std::string_view content) -> std::optional<Value> {
        if (auto bytes = decodeBase64(content)) return Data{std::move(*bytes)};
        return std::nullopt;
      });
    if (name == "key") return fail(node, "a \"key\" outside a \"dict\"");
    return fail(node, fmt::format("unknown element {}", quoted(node)));
  }

  static bool isBlankElement(const pugi::xml_node& node) {
    return std::all_of(node.begin(), node.end(), [](const pugi::xml_node& child) { return isIgnorable(child); });
  }

  template <class Parse>
  std::optional<Value> parsed(const pugi::xml_node& node, std::string_view what, Parse parse) {
    const std::optional<std::string> content = text(node);
    if (!content) return std::nullopt;
    std::optional<Value> result = parse(trimmed(*content));
    if (!result) return fail(node, fmt::format("{} that holds no {}", quoted(node), what.substr(what.find(' ') + 1)));
    return result;
  }

  // All of an element's text, references resolved.
  std::optional<std::string> text(const pugi::xml_node& element) {
    std::string content;
    for (const pugi::xml_node child : element.children()) {
      if (child.type() == pugi::node_cdata) {
        content += child.value();
      } else if (child.type() != pugi::node_pcdata) {
        return fail(child, fmt::format("an element inside {}", quoted(element)));
      } else if (!appendUnescaped(content, child.value())) {
        return fail(child, "an entity that is not predefined, or a reference to no XML character, in the text");
      }
    }
    return content;
  }

  static bool appendUnescaped(std::string& out, std::string_view raw) {
    for (;;) {
      const std::size_t ampersand = raw.find('&');
      out += raw.substr(0, ampersand);
      if (ampersand == raw.npos) return true;
      raw.remove_prefix(ampersand + 1);
      const std::size_t end = raw.find(';');
      if (end == raw.npos) return false;
      const std::optional<char32_t> codePoint = entity(raw.substr(0, end));
      if (!codePoint) return false;
      appendUtf8(out, *codePoint);
      raw.remove_prefix(end + 1);
    }
  }

  std::optional<Value> array(const pugi::xml_node& node, std::size_t depth) {
    Array elements;
    for (pugi::xml_node child = nextElement(node.first_child()); child; child = nextElement(child.next_sibling())) {
      std::optional<Value> element = value(child, depth);
      if (!element) return std::nullopt;
      elements.push_back(std::move(*element));
    }
    if (failed()) return std::nullopt;
    return Value(std::move(elements));
  }

  std::optional<Value> dictionary(const pugi::xml_node& node, std::size_t depth) {
    std::vector<Dictionary::Entry> entries;
    for (pugi::xml_node child = nextElement(node.first_child()); child; child = nextElement(child.next_sibling())) {
      if (child.name() != std::string_view("key"))
        return fail(child, fmt::format("{} without a \"key\"", quoted(child)));
      std::optional<std::string> key = text(child);
      if (!key) return std::nullopt;
      const pugi::xml_node valueNode = nextElement(child.next_sibling());
      if (failed()) return std::nullopt;
      if (!valueNode || valueNode.name() == std::string_view("key")) return fail(child, "a \"key\" without a value");
      std::optional<Value> element = value(valueNode, depth);
      if (!element) return std::nullopt;
      entries.emplace_back(std::move(*key), std::move(*element));
      child = valueNode;
    }
    if (failed()) return std::nullopt;
    std::optional<Dictionary> result = Dictionary::fromUniqueEntries(std::move(entries));
    if (!result) return fail(node, "a \"dict\" with the same key twice");
    return Value(std::move(*result));
  }

  const PropertyListLimits& _limits;
  std::size_t _objects = 0;
  std::string _error;
};

}  // namespace

Result<Value> parseXmlPropertyList(std::span<const std::uint8_t> bytes, const PropertyListLimits& limits) {
  if (bytes.size() > limits.maximumBytes) {
    return Failure{fmt::format("a property list of more than {} bytes", limits.maximumBytes)};
  }
  const std::string_view text(reinterpret_cast<const char*>(bytes.data()), bytes.size());
  if (const auto offset = findNonXmlCharacter(text)) {
    return Failure{fmt::format("no UTF-8, or a character that XML does not allow, at byte {}", *offset)};
  }
  // The tree takes some 60 bytes for each markup, so it must not be built of more than the limits can need: two for
  // each key and each value, and some for comments.
  const auto markups = static_cast<std::size_t>(std::count(text.begin(), text.end(), '<'));
  if (markups / 5 > limits.maximumObjects) return Failure{fmt::format("more than {} values", limits.maximumObjects)};

  try {
    // References stay as they are, so that ones which XML does not predefine can be refused. Text outside the root is
    // kept (as in a fragment) for the same reason.
    constexpr unsigned kOptions =
        pugi::parse_cdata | pugi::parse_eol | pugi::parse_declaration | pugi::parse_ws_pcdata | pugi::parse_fragment;
    pugi::xml_document document;
    const pugi::xml_parse_result parsed = document.load_buffer(text.data(), text.size(), kOptions, pugi::encoding_utf8);
    if (!parsed) return Failure{fmt::format("{} at byte {}", parsed.description(), parsed.offset)};
    XmlReader reader(limits);
    if (std::optional<Value> value = reader.document(document)) return std::move(*value);
    return Failure{reader.error()};
  } catch (const std::bad_alloc&) {
    return Failure{"no memory for the property list"};
  }
}

}  // namespace orvanta::platform
