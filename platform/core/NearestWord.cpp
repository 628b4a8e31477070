#include "platform/core/NearestWord.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstddef>
#include <numeric>
#include <utility>
#include <vector>

namespace orvanta::platform {

namespace {

constexpr std::size_t kLongestWord = 64;  // longer ones resemble nothing

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

}  // namespace

std::string_view nearestWord(std::string_view word, std::span<const std::string_view> known) {
  word = word.substr(0, kLongestWord);
  return *std::min_element(known.begin(), known.end(), [&](std::string_view a, std::string_view b) {
    return editDistance(word, a) < editDistance(word, b);
  });
}

std::string describeUnknownKeys(const Dictionary& dictionary, std::span<const std::string_view> known) {
  std::string text;
  for (const auto& [key, value] : dictionary) {
    if (std::find(known.begin(), known.end(), key) != known.end()) continue;
    if (!text.empty()) text += "; ";
    text += fmt::format("unknown key \"{}\", did you mean \"{}\"?", key, nearestWord(key, known));
  }
  return text;
}

}  // namespace orvanta::platform
