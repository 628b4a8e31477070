#include "platform/codec/XmlCharacters.h"

#include "platform/core/Utf8.h"

namespace orvanta::platform {

bool isXmlCharacter(char32_t codePoint) {
  if (codePoint < 0x20) return codePoint == '\t' || codePoint == '\n' || codePoint == '\r';
  if (codePoint >= 0xd800 && codePoint <= 0xdfff) return false;
  return codePoint != 0xfffe && codePoint != 0xffff && codePoint <= 0x10ffff;
}

std::optional<std::size_t> findNonXmlCharacter(std::string_view text) {
  std::size_t i = 0;
  while (i < text.size()) {
    const auto byte = static_cast<unsigned char>(text[i]);
    if (byte >= 0x20 && byte < 0x80) {
      ++i;
      continue;
    }
    const Utf8Character character = firstUtf8Character(text.substr(i));
    if (!character.valid || !isXmlCharacter(character.codePoint)) return i;
    i += character.length;
  }
  return std::nullopt;
}

}  // namespace orvanta::platform
