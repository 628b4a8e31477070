#include "backends/https/StringMatching.h"

#include <algorithm>

namespace orvanta {
namespace {

// One code point off the front; a byte that begins no UTF-8 sequence stands for itself, above every code point.
char32_t takeCodePoint(std::string_view& text) {
  constexpr char32_t kStrayByte = 0x110000;
  const auto byteAt = [&](std::size_t index) { return static_cast<unsigned char>(text[index]); };
  const unsigned char lead = byteAt(0);
  std::size_t length = 1;
  char32_t point = lead;
  if (lead >= 0x80) {
    length = lead >= 0xF0 ? 4 : lead >= 0xE0 ? 3 : 2;
    point = lead & (0x7FU >> length);
    bool whole = lead >= 0xC0 && text.size() >= length;
    for (std::size_t i = 1; whole && i < length; ++i) {
      whole = (byteAt(i) & 0xC0U) == 0x80;
      point = (point << 6U) | (byteAt(i) & 0x3FU);
    }
    if (!whole) {
      length = 1;
      point = kStrayByte + lead;
    }
  }
  text.remove_prefix(length);
  return point;
}

// A run of letters whose small forms lie `distance` above the capitals; 1 means that capitals and small letters
// alternate, beginning with a capital.
struct CaseRun {
  char32_t first;
  char32_t last;
  char32_t distance;
};

constexpr CaseRun kCaseRuns[] = {
    {0x00C0, 0x00D6, 32},  // Latin-1
    {0x00D8, 0x00DE, 32},  //
    {0x0100, 0x012F, 1},   // Latin Extended-A
    {0x0132, 0x0137, 1},   //
    {0x0139, 0x0148, 1},   //
    {0x014A, 0x0177, 1},   //
    {0x0179, 0x017E, 1},   //
    {0x0386, 0x0386, 38},  // Greek
    {0x0388, 0x038A, 37},  //
    {0x038C, 0x038C, 64},  //
    {0x038E, 0x038F, 63},  //
    {0x0391, 0x03A1, 32},  //
    {0x03A3, 0x03AB, 32},  //
    {0x03C2, 0x03C2, 1},   // final sigma
    {0x0400, 0x040F, 80},  // Cyrillic
    {0x0410, 0x042F, 32},  //
    {0x0460, 0x0481, 1},   //
    {0x048A, 0x04BF, 1},   //
    {0x04C0, 0x04C0, 15},  //
    {0x04C1, 0x04CE, 1},   //
    {0x04D0, 0x052F, 1},   //
    {0x0531, 0x0556, 48},  // Armenian
    {0x1E00, 0x1E95, 1},   // Latin Extended Additional
    {0x1EA0, 0x1EFF, 1},   //
    {0xFF21, 0xFF3A, 32},  // fullwidth Latin
};

char32_t fold(char32_t point) {
  if (point < 0x80) return point >= 'A' && point <= 'Z' ? point + 32 : point;
  if (point == 0x0178) return 0x00FF;  // the one small letter that lies in another block
  for (const CaseRun& run : kCaseRuns) {
    if (point < run.first) break;
    if (point > run.last) continue;
    if (run.distance != 1) return point + run.distance;
    return (point - run.first) % 2 == 0 ? point + 1 : point;
  }
  return point;
}

void appendCodePoint(std::string& out, char32_t point) {
  const auto append = [&](char32_t byte) { out.push_back(static_cast<char>(byte)); };
  if (point < 0x80 || point >= 0x110000) {
    append(point & 0xFFU);
  } else if (point < 0x800) {
    append(0xC0U | (point >> 6U));
    append(0x80U | (point & 0x3FU));
  } else if (point < 0x10000) {
    append(0xE0U | (point >> 12U));
    append(0x80U | ((point >> 6U) & 0x3FU));
    append(0x80U | (point & 0x3FU));
  } else {
    append(0xF0U | (point >> 18U));
    append(0x80U | ((point >> 12U) & 0x3FU));
    append(0x80U | ((point >> 6U) & 0x3FU));
    append(0x80U | (point & 0x3FU));
  }
}

// The answer where the elements need not be looked at.
std::optional<bool> answerWithoutSearch(const TextList& list, const std::optional<std::string>& wholeString,
                                        bool whitelist) {
  if (list.empty()) return whitelist;
  if (!wholeString) return !whitelist;
  return std::nullopt;
}

}  // namespace

std::string foldCase(std::string_view text) {
  std::string folded;
  folded.reserve(text.size());
  while (!text.empty()) appendCodePoint(folded, fold(takeCodePoint(text)));
  return folded;
}

bool equalsFolded(std::string_view a, std::string_view b) {
  while (!a.empty() && !b.empty()) {
    if (fold(takeCodePoint(a)) != fold(takeCodePoint(b))) return false;
  }
  return a.empty() && b.empty();
}

bool matchExactStringWithList(const TextList& list, const std::optional<std::string>& wholeString, bool whitelist) {
  if (const auto answer = answerWithoutSearch(list, wholeString, whitelist)) return *answer;
  return std::any_of(list.begin(), list.end(),
                     [&](const std::string& element) { return equalsFolded(element, *wholeString); });
}

bool matchStringWithList(const TextList& list, const std::optional<std::string>& wholeString, bool whitelist) {
  if (const auto answer = answerWithoutSearch(list, wholeString, whitelist)) return *answer;
  const std::string whole = foldCase(*wholeString);
  return std::any_of(list.begin(), list.end(),
                     [&](const std::string& element) { return whole.find(foldCase(element)) != std::string::npos; });
}

TextList splitAtCommas(std::string_view text) {
  TextList pieces;
  while (true) {
    const std::size_t comma = text.find(',');
    pieces.emplace_back(text.substr(0, comma));
    if (comma == std::string_view::npos) return pieces;
    text.remove_prefix(comma + 1);
  }
}

}  // namespace orvanta
