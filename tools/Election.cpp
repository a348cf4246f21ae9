#include "tools/Election.h"

#include <charconv>
#include <string_view>

namespace tools {

namespace {

struct Word {
  std::string_view text;
  std::int64_t election;
};
constexpr Word kWords[] = {{"use", 1}, {"ignore", 2}, {"clear", 0}};

}  // namespace

std::optional<std::int64_t> electionFromText(const std::string& text) {
  for (const Word& word : kWords) {
    if (word.text == text) return word.election;
  }
  std::int64_t number = 0;
  const char* const end = text.data() + text.size();
  const auto parsed = std::from_chars(text.data(), end, number);
  return !text.empty() && parsed.ptr == end && parsed.ec == std::errc() ? std::optional(number) : std::nullopt;
}

std::string electionText(const platform::Value& election) {
  if (election.isNothing() || election == platform::Value(0)) return "none";
  for (const Word& word : kWords) {
    if (election == platform::Value(word.election)) return std::string(word.text);
  }
  return election.describe();
}

}  // namespace tools
