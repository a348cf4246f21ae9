#include "platform/value/Utf8.h"

#include <cstdint>
#include <cstring>

namespace platform {
namespace {

constexpr std::size_t kWord = sizeof(std::uint64_t);

// Eight ASCII characters from the space on: no high bit, and none that borrows when a space is subtracted.
bool isPlain(const char* from) noexcept {
  std::uint64_t word = 0;
  std::memcpy(&word, from, sizeof word);
  return ((word | (word - 0x2020202020202020U)) & 0x8080808080808080U) == 0;
}

struct Character {
  char32_t code = 0;
  std::size_t length = 0;  // 0: not valid
};

// The character at the beginning of `text`, which is not empty.
Character firstCharacter(std::string_view text) noexcept {
  const auto byte = [&](std::size_t i) { return static_cast<unsigned char>(text[i]); };
  const unsigned char lead = byte(0);
  if (lead < 0x80) return {lead, 1};
  const std::size_t length = lead >= 0xF0 ? 4 : lead >= 0xE0 ? 3 : 2;
  if (lead < 0xC2 || lead > 0xF4 || text.size() < length) return {};
  char32_t code = lead & (0x7FU >> length);
  for (std::size_t i = 1; i < length; ++i) {
    if ((byte(i) & 0xC0) != 0x80) return {};
    code = code << 6 | (byte(i) & 0x3FU);
  }
  if (length == 3 && (code < 0x800 || (code >= 0xD800 && code <= 0xDFFF))) return {};
  if (length == 4 && (code < 0x10000 || code > 0x10FFFF)) return {};
  return {code, length};
}

bool isXmlCharacter(char32_t code) noexcept {
  if (code < 0x20) return code == '\t' || code == '\n' || code == '\r';
  return code != 0xFFFE && code != 0xFFFF;
}

}  // namespace

bool isUtf8(std::string_view text) noexcept {
  while (!text.empty()) {
    const Character character = firstCharacter(text);
    if (character.length == 0) return false;
    text.remove_prefix(character.length);
  }
  return true;
}

std::size_t xmlTextLength(std::string_view text) noexcept {
  const char* const data = text.data();
  const std::size_t size = text.size();
  std::size_t at = 0;
  while (at < size) {
    while (size - at >= kWord && isPlain(data + at)) at += kWord;
    if (at == size) break;
    // Less than a word is left: look at the last whole word once more, instead of at single characters.
    if (size - at < kWord && size >= kWord && isPlain(data + size - kWord)) return size;
    if (const auto c = static_cast<unsigned char>(data[at]); c >= 0x20 && c < 0x80) {
      ++at;
      continue;
    }
    const Character character = firstCharacter(text.substr(at));
    if (character.length == 0 || !isXmlCharacter(character.code)) break;
    at += character.length;
  }
  return at;
}

std::string repairedXmlText(std::string_view text) {
  std::string out;
  while (!text.empty()) {
    const std::size_t good = xmlTextLength(text);
    out += text.substr(0, good);
    text.remove_prefix(good);
    if (text.empty()) break;
    out += "\xEF\xBF\xBD";
    text.remove_prefix(1);
  }
  return out;
}

}  // namespace platform
