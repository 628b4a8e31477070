#include "platform/sandbox/SandboxProfile.h"

#include <fmt/format.h>

#include <algorithm>
#include <utility>

#include "platform/core/Text.h"
#include "platform/sandbox/Landlock.h"

namespace orvanta::platform {

namespace {

constexpr std::int64_t kFormatVersion = 1;

struct AccessWord {
  std::string_view word;
  std::uint64_t rights;
};

constexpr AccessWord kAccessWords[] = {
    {"read", kLandlockReadFile | kLandlockReadDirectory},
    {"write", kLandlockWriteFile | kLandlockTruncate},
    {"create", kLandlockMakeRegular | kLandlockMakeDirectory},
    {"remove", kLandlockRemoveFile | kLandlockRemoveDirectory},
    {"socket", kLandlockMakeSocket},
    {"execute", kLandlockExecute},
};

// Absolute, or beginning with a place; every place is closed.
bool isWellFormedPath(std::string_view path) {
  if (!path.starts_with("/") && !path.starts_with("${")) return false;
  for (std::size_t begin = path.find("${"); begin != std::string_view::npos; begin = path.find("${", begin + 1)) {
    const std::size_t end = path.find('}', begin);
    if (end == std::string_view::npos || end == begin + 2) return false;
  }
  return path.find('\0') == std::string_view::npos;
}

Result<std::vector<std::string>> readPaths(const Dictionary& entry, const std::string& place, std::string_view key) {
  std::vector<std::string> paths;
  const Value* value = entry.find(key);
  if (value == nullptr) return paths;
  const Array* list = value->array();
  if (list == nullptr) return Failure{fmt::format("{}: \"{}\" must be a list of paths", place, key)};
  for (const Value& item : *list) {
    if (item.string() == nullptr || !isWellFormedPath(*item.string())) {
      return Failure{fmt::format("{}: \"{}\" holds {}, which is no absolute path or ${{NAME}} path", place, key,
                                 item.string() != nullptr ? "\"" + *item.string() + "\"" : item.description())};
    }
    paths.push_back(*item.string());
  }
  return paths;
}

Result<std::uint64_t> readAccess(const Dictionary& entry, const std::string& place) {
  const Array* list = entry.array("access");
  if (list == nullptr || list->empty()) return Failure{place + ": \"access\" must be a list of at least one word"};
  std::uint64_t rights = 0;
  for (const Value& item : *list) {
    const std::string word = item.string() != nullptr ? *item.string() : item.description();
    const auto* found = std::find_if(std::begin(kAccessWords), std::end(kAccessWords),
                                     [&](const AccessWord& known) { return known.word == word; });
    if (found == std::end(kAccessWords)) {
      std::vector<std::string_view> words;
      for (const AccessWord& known : kAccessWords) words.push_back(known.word);
      return Failure{
          fmt::format("{}: unknown access \"{}\", did you mean \"{}\"?", place, word, nearestWord(word, words))};
    }
    rights |= found->rights;
  }
  return rights;
}

Result<SandboxProfile::FileRule> readFileRule(const Value& value, const std::string& place) {
  const Dictionary* entry = value.dictionary();
  if (entry == nullptr) return Failure{place + " must be a dictionary"};
  static constexpr std::string_view kKeys[] = {"paths", "directoriesOf", "access", "optional"};
  if (const std::string unknown = describeUnknownKeys(*entry, kKeys); !unknown.empty()) {
    return Failure{place + ": " + unknown};
  }
  SandboxProfile::FileRule rule;
  auto paths = readPaths(*entry, place, "paths");
  if (!paths) return Failure{paths.error()};
  auto directoriesOf = readPaths(*entry, place, "directoriesOf");
  if (!directoriesOf) return Failure{directoriesOf.error()};
  rule.paths = std::move(*paths);
  rule.directoriesOf = std::move(*directoriesOf);
  if (rule.paths.empty() && rule.directoriesOf.empty()) {
    return Failure{place + " names no path: give \"paths\" or \"directoriesOf\""};
  }
  const auto rights = readAccess(*entry, place);
  if (!rights) return Failure{rights.error()};
  rule.rights = *rights;
  if (const Value* optional = entry->find("optional")) {
    if (!optional->isBool()) return Failure{place + ": \"optional\" must be true or false"};
    rule.optional = optional->boolValue();
  }
  return rule;
}

}  // namespace

Result<SandboxProfile> SandboxProfile::fromPropertyList(const Value& document) {
  const Dictionary* content = document.dictionary();
  if (content == nullptr) return Failure{"a profile must be a dictionary"};
  static constexpr std::string_view kKeys[] = {"version", "files", "calls", "landlockABI"};
  if (const std::string unknown = describeUnknownKeys(*content, kKeys); !unknown.empty()) {
    return Failure{"the profile: " + unknown};
  }
  const Value* version = content->find("version");
  if (version == nullptr || !version->isInteger() || version->integerValue() != kFormatVersion) {
    return Failure{fmt::format("\"version\" must be {}", kFormatVersion)};
  }
  const Array* files = content->array("files");
  if (files == nullptr) return Failure{"\"files\" must be a list"};
  SandboxProfile profile;
  for (std::size_t index = 0; index < files->size(); ++index) {
    auto rule = readFileRule((*files)[index], fmt::format("files[{}]", index));
    if (!rule) return Failure{rule.error()};
    profile.files.push_back(std::move(*rule));
  }
  const Value* calls = content->find("calls");
  if (calls == nullptr) return Failure{"\"calls\" is missing"};
  auto read = SandboxCalls::fromPropertyList(*calls);
  if (!read) return Failure{read.error()};
  profile.calls = std::move(*read);
  if (const Value* abi = content->find("landlockABI")) {
    if (!abi->isInteger() || abi->integerValue() < 1 || abi->integerValue() > Landlock::kAnyAbi) {
      return Failure{"\"landlockABI\" must be a number from 1"};
    }
    profile.landlockAbi = static_cast<int>(abi->integerValue());
  }
  return profile;
}

std::optional<std::string> fillPlaces(std::string_view path, const std::map<std::string, std::string>& variables) {
  std::string filled;
  while (true) {
    const std::size_t begin = path.find("${");
    filled += path.substr(0, begin);
    if (begin == std::string_view::npos) return filled;
    const std::size_t end = path.find('}', begin);
    if (end == std::string_view::npos) return std::nullopt;
    const auto variable = variables.find(std::string(path.substr(begin + 2, end - begin - 2)));
    if (variable == variables.end() || variable->second.empty()) return std::nullopt;
    filled += variable->second;
    path.remove_prefix(end + 1);
  }
}

}  // namespace orvanta::platform
