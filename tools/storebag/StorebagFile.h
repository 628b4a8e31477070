#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "interface/Values.h"
#include "tools/storebag/SigningKey.h"

namespace orvanta {

enum class PropertyListForm { xml, binary };

// "xml" or "binary"; returns nullopt for anything else.
std::optional<PropertyListForm> propertyListFormFromText(std::string_view text);
std::string_view propertyListFormText(PropertyListForm form);

Result<std::vector<std::uint8_t>> writePropertyList(const Value& value, PropertyListForm form);

// The parts of a storebag document, whether or not its signature is right.
struct StorebagContent {
  std::vector<std::uint8_t> bag;
  std::vector<std::uint8_t> signature;
  Value inner;
};

// The signed document of an inner bag; the container and the bag inside it may be of different forms.
Result<std::vector<std::uint8_t>> makeStorebag(const Value& inner, const SigningKey& key, PropertyListForm container,
                                               PropertyListForm bag);
Result<StorebagContent> openStorebag(std::span<const std::uint8_t> document);

// Reads an inner bag as its author keeps it: JSON or a property list of either form, told apart by the first bytes. The
// failure says what is wrong and where.
Result<Value> parseBagSource(std::span<const std::uint8_t> bytes);
Result<Value> readBagSource(const std::string& path);

Result<std::vector<std::uint8_t>> readFile(const std::string& path);
// Replaces the file whole: readers see the old content or the new. The failure names the file.
Result<void> writeFile(const std::string& path, std::span<const std::uint8_t> bytes);

}  // namespace orvanta
