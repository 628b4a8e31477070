#include "tools/storebag/StorebagFile.h"

#include <fmt/format.h>

#include <cerrno>
#include <filesystem>
#include <fstream>

#include "platform/codec/Json.h"
#include "platform/codec/PropertyList.h"
#include "platform/core/Text.h"
#include "platform/core/WholeFile.h"

namespace orvanta {

namespace {

constexpr std::size_t kMaximumFileBytes = 64U << 20U;

Result<std::vector<std::uint8_t>> decodedField(const Dictionary& document, std::string_view key) {
  if (!document.contains(key)) return Failure{fmt::format("the document has no \"{}\"", key)};
  const std::string* text = document.text(key);
  if (text == nullptr) return Failure{fmt::format("the document's \"{}\" is not a string", key)};
  auto bytes = platform::decodeBase64(*text);
  if (!bytes) return Failure{fmt::format("the document's \"{}\" is not base64", key)};
  return std::move(*bytes);
}

}  // namespace

std::optional<PropertyListForm> propertyListFormFromText(std::string_view text) {
  if (text == "xml") return PropertyListForm::xml;
  if (text == "binary") return PropertyListForm::binary;
  return std::nullopt;
}

std::string_view propertyListFormText(PropertyListForm form) {
  return form == PropertyListForm::xml ? "xml" : "binary";
}

Result<std::vector<std::uint8_t>> writePropertyList(const Value& value, PropertyListForm form) {
  if (form == PropertyListForm::binary) return platform::writeBinaryPropertyList(value);
  const auto text = platform::writeXmlPropertyList(value);
  if (!text) return Failure{text.error()};
  return std::vector<std::uint8_t>(text.value().begin(), text.value().end());
}

Result<std::vector<std::uint8_t>> makeStorebag(const Value& inner, const SigningKey& key, PropertyListForm container,
                                               PropertyListForm bag) {
  if (inner.dictionary() == nullptr) return Failure{"a bag must be a dictionary"};
  auto bagBytes = writePropertyList(inner, bag);
  if (!bagBytes) return bagBytes;
  auto signature = key.sign(bagBytes.value());
  if (!signature) return signature;
  return writePropertyList(Dictionary{{"signature", platform::encodeBase64(signature.value())},
                                      {"bag", platform::encodeBase64(bagBytes.value())}},
                           container);
}

Result<StorebagContent> openStorebag(std::span<const std::uint8_t> document) {
  const auto parsed = platform::parsePropertyList(document);
  if (!parsed) return Failure{"the document holds no property list: " + parsed.error()};
  const Dictionary* fields = parsed.value().dictionary();
  if (fields == nullptr) return Failure{"the document is not a dictionary"};
  auto signature = decodedField(*fields, "signature");
  if (!signature) return Failure{signature.error()};
  auto bag = decodedField(*fields, "bag");
  if (!bag) return Failure{bag.error()};
  auto inner = platform::parsePropertyList(bag.value());
  if (!inner) return Failure{"the bag inside is not a property list: " + inner.error()};
  return StorebagContent{std::move(bag.value()), std::move(signature.value()), std::move(inner.value())};
}

Result<Value> parseBagSource(std::span<const std::uint8_t> bytes) {
  std::string_view text(reinterpret_cast<const char*>(bytes.data()), bytes.size());
  const auto first = text.find_first_not_of(" \t\r\n");
  auto parsed = first != std::string_view::npos && text[first] == '{' ? platform::parseJson(text)
                                                                      : platform::parsePropertyList(bytes);
  if (parsed && parsed.value().dictionary() == nullptr) return Failure{"a bag must be a dictionary"};
  return parsed;
}

Result<Value> readBagSource(const std::string& path) {
  const auto bytes = readFile(path);
  if (!bytes) return Failure{bytes.error()};
  auto bag = parseBagSource(bytes.value());
  if (!bag) return Failure{fmt::format("{}: {}", path, bag.error())};
  return bag;
}

Result<std::vector<std::uint8_t>> readFile(const std::string& path) {
  const auto bytes = platform::readWholeFile(path, kMaximumFileBytes);
  if (!bytes) return Failure{bytes.error()};
  return std::vector<std::uint8_t>(bytes->begin(), bytes->end());
}

Result<void> writeFile(const std::string& path, std::span<const std::uint8_t> bytes) {
  const std::string temporary = path + ".new";
  {
    std::ofstream file(temporary, std::ios::binary | std::ios::trunc);
    file.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
    file.flush();
    if (!file) {
      return Failure{fmt::format("cannot write {}: {}", temporary, platform::errnoText(errno))};
    }
  }
  std::error_code error;
  std::filesystem::rename(temporary, path, error);
  if (error) return Failure{fmt::format("cannot write {}: {}", path, error.message())};
  return {};
}

}  // namespace orvanta
