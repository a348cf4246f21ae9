#include "platform/value/NumericOrder.h"

namespace platform {
namespace {

bool isDigit(char c) noexcept {
  return c >= '0' && c <= '9';
}

// The run of digits at the beginning of `text`, taken off it, without leading zeros: empty for the value 0.
std::string_view takeRun(std::string_view& text) noexcept {
  std::size_t end = 0;
  while (end < text.size() && isDigit(text[end])) ++end;
  std::string_view run = text.substr(0, end);
  text.remove_prefix(end);
  while (!run.empty() && run.front() == '0') run.remove_prefix(1);
  return run;
}

}  // namespace

std::weak_ordering compareNumeric(std::string_view a, std::string_view b) noexcept {
  while (!a.empty() && !b.empty()) {
    if (isDigit(a.front()) && isDigit(b.front())) {
      const std::string_view left = takeRun(a);
      const std::string_view right = takeRun(b);
      if (left.size() != right.size()) return left.size() <=> right.size();
      if (const int order = left.compare(right); order != 0) return order <=> 0;
    } else {
      // Bytes of UTF-8 order as their code points do.
      const auto left = static_cast<unsigned char>(a.front());
      const auto right = static_cast<unsigned char>(b.front());
      if (left != right) return left <=> right;
      a.remove_prefix(1);
      b.remove_prefix(1);
    }
  }
  return a.size() <=> b.size();
}

std::string withoutLeadingZeros(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  while (!text.empty()) {
    if (isDigit(text.front())) {
      const std::string_view run = takeRun(text);
      out += run.empty() ? std::string_view("0") : run;
    } else {
      out += text.front();
      text.remove_prefix(1);
    }
  }
  return out;
}

}  // namespace platform
