#include "xtd/ElectionFilter.h"

#include <locale.h>
#include <wctype.h>

#include <algorithm>
#include <cstdint>
#include <span>
#include <string_view>
#include <utility>

#include "Extora/XTVocabulary.h"

namespace extora {

using platform::Value;

namespace {

// The first character of valid UTF-8 that is not empty.
wint_t firstCharacter(std::string_view text) {
  const auto lead = static_cast<unsigned char>(text.front());
  if (lead < 0x80) return lead;
  const std::size_t length = lead >= 0xF0 ? 4 : lead >= 0xE0 ? 3 : 2;
  wint_t code = lead & (0x7FU >> length);
  for (const char c : text.substr(1, length - 1)) code = code << 6 | (static_cast<unsigned char>(c) & 0x3FU);
  return code;
}

// A letter, mark or number of any script, whatever locale the process runs in.
bool isAlphanumeric(wint_t character) {
  static const locale_t unicode = newlocale(LC_CTYPE_MASK, "C.UTF-8", nullptr);
  if (unicode == nullptr) return iswalnum(character) != 0;
  static const wctype_t mark = wctype_l("combining", unicode);
  return iswalnum_l(character, unicode) != 0 || (mark != 0 && iswctype_l(character, mark, unicode) != 0);
}

std::optional<std::string> convert(const Value& element) {
  const std::string& text = element.string();
  if (text.empty()) return std::nullopt;
  if (text.front() == '=') return text.substr(1);
  if (!isAlphanumeric(firstCharacter(text))) return std::nullopt;
  return text;
}

}  // namespace

std::optional<ElectionFilter> ElectionFilter::fromQuery(const Value& query) {
  const Value& wanted = query[XTUserElectionAttribute];
  if (!wanted.isArray() && !wanted.isString()) return std::nullopt;
  std::vector<std::string> values;
  for (const Value& element : wanted.isArray() ? wanted.items() : std::span(&wanted, 1)) {
    std::optional<std::string> value = convert(element);
    if (!value) return std::nullopt;
    values.push_back(std::move(*value));
  }
  return ElectionFilter(std::move(values));
}

bool ElectionFilter::accepts(const Value& election) const {
  const std::string text = std::to_string(electionBits(election) & 0xFF);
  return std::find(values_.begin(), values_.end(), text) != values_.end();
}

std::uint64_t electionBits(const Value& election) noexcept {
  return election.kind() == platform::Kind::Unsigned ? election.exactUnsigned()
                                                     : static_cast<std::uint64_t>(election.integerValue());
}

std::string electionText(const Value& election) {
  return election.kind() == platform::Kind::Unsigned ? std::to_string(election.exactUnsigned())
                                                     : std::to_string(election.integerValue());
}

}  // namespace extora
