#include "platform/SandboxProfile.h"

#include <fmt/format.h>

#include <algorithm>
#include <initializer_list>
#include <numeric>
#include <span>
#include <utility>

#include "platform/Landlock.h"

namespace platform {

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

std::size_t editDistance(std::string_view a, std::string_view b) {
  std::vector<std::size_t> row(b.size() + 1);
  std::iota(row.begin(), row.end(), std::size_t{0});
  for (std::size_t i = 0; i < a.size(); ++i) {
    std::size_t diagonal = std::exchange(row[0], i + 1);
    for (std::size_t j = 0; j < b.size(); ++j) {
      const std::size_t replaced = diagonal + (a[i] == b[j] ? 0 : 1);
      diagonal = row[j + 1];
      row[j + 1] = std::min({replaced, row[j] + 1, diagonal + 1});
    }
  }
  return row.back();
}

constexpr std::size_t kLongestWord = 64;  // longer ones resemble nothing

std::string nearest(std::string_view word, std::span<const std::string_view> known) {
  word = word.substr(0, kLongestWord);
  return std::string(*std::min_element(known.begin(), known.end(), [&](std::string_view a, std::string_view b) {
    return editDistance(word, a) < editDistance(word, b);
  }));
}

// The failure for the first key that is not among `known`.
std::optional<Failure> findUnknownKey(const Dictionary& dictionary, const std::string& place,
                                      std::initializer_list<std::string_view> known) {
  for (const auto& [key, value] : dictionary) {
    if (std::find(known.begin(), known.end(), key) != known.end()) continue;
    return Failure{fmt::format("{}: unknown key \"{}\", did you mean \"{}\"?", place, key,
                               nearest(key, {known.begin(), known.size()}))};
  }
  return std::nullopt;
}

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
  const Value* value = entry.find("access");
  const Array* list = value == nullptr ? nullptr : value->array();
  if (list == nullptr || list->empty()) return Failure{place + ": \"access\" must be a list of at least one word"};
  std::uint64_t rights = 0;
  for (const Value& item : *list) {
    const std::string word = item.string() != nullptr ? *item.string() : item.description();
    const auto* found = std::find_if(std::begin(kAccessWords), std::end(kAccessWords),
                                     [&](const AccessWord& known) { return known.word == word; });
    if (found == std::end(kAccessWords)) {
      std::vector<std::string_view> words;
      for (const AccessWord& known : kAccessWords) words.push_back(known.word);
      return Failure{fmt::format("{}: unknown access \"{}\", did you mean \"{}\"?", place, word, nearest(word, words))};
    }
    rights |= found->rights;
  }
  return rights;
}

Result<SandboxProfile::FileRule> readFileRule(const Value& value, const std::string& place) {
  const Dictionary* entry = value.dictionary();
  if (entry == nullptr) return Failure{place + " must be a dictionary"};
  if (auto unknown = findUnknownKey(*entry, place, {"paths", "directoriesOf", "access", "optional"})) return *unknown;
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
  if (auto unknown = findUnknownKey(*content, "the profile", {"version", "files"})) return *unknown;
  const Value* version = content->find("version");
  if (version == nullptr || !version->isInteger() || version->integerValue() != kFormatVersion) {
    return Failure{fmt::format("\"version\" must be {}", kFormatVersion)};
  }
  const Value* files = content->find("files");
  if (files == nullptr || files->array() == nullptr) return Failure{"\"files\" must be a list"};
  SandboxProfile profile;
  for (std::size_t index = 0; index < files->array()->size(); ++index) {
    auto rule = readFileRule((*files->array())[index], fmt::format("files[{}]", index));
    if (!rule) return Failure{rule.error()};
    profile.files.push_back(std::move(*rule));
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

}  // namespace platform
