#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/core/Result.h"
#include "platform/core/Value.h"
#include "tools/storebag/SigningKey.h"

namespace orvanta {

enum class PropertyListForm { xml, binary };

// "xml" or "binary"; none for anything else.
std::optional<PropertyListForm> propertyListFormFromText(std::string_view text);
std::string_view propertyListFormText(PropertyListForm form);

platform::Result<std::vector<std::uint8_t>> writePropertyList(const platform::Value& value, PropertyListForm form);

// What a storebag document holds once it is taken apart, whether or not its signature is right.
struct StorebagContent {
  std::vector<std::uint8_t> bag;
  std::vector<std::uint8_t> signature;
  platform::Value inner;
};

// The signed document of an inner bag; the container and the bag inside it may be of different forms.
platform::Result<std::vector<std::uint8_t>> makeStorebag(const platform::Value& inner, const SigningKey& key,
                                                         PropertyListForm container, PropertyListForm bag);
platform::Result<StorebagContent> openStorebag(std::span<const std::uint8_t> document);

// An inner bag as its author keeps it: JSON, or a property list of either form, told apart by the first bytes. The
// failure says what and where.
platform::Result<platform::Value> parseBagSource(std::span<const std::uint8_t> bytes);
platform::Result<platform::Value> readBagSource(const std::string& path);

platform::Result<std::vector<std::uint8_t>> readFile(const std::string& path);
// Replaces the file whole: readers see the old content or the new. None, or why it cannot be written.
std::optional<platform::Failure> writeFile(const std::string& path, std::span<const std::uint8_t> bytes);

}  // namespace orvanta
