#include "tools/Table.h"

#include <algorithm>
#include <clocale>
#include <cwchar>

#include "platform/log/Log.h"

namespace tools {

std::size_t displayWidth(const std::string& text) {
  // A locale object of its own: the process's locale is the user's business.
  static const locale_t locale = ::newlocale(LC_CTYPE_MASK, "C.UTF-8", nullptr);
  if (locale == nullptr) {  // count what begins a character
    return static_cast<std::size_t>(std::count_if(text.begin(), text.end(), [](char c) { return (c & 0xc0) != 0x80; }));
  }
  const locale_t old = ::uselocale(locale);
  std::size_t width = 0;
  std::mbstate_t state{};
  for (std::size_t i = 0; i < text.size();) {
    wchar_t character = 0;
    const std::size_t length = std::mbrtowc(&character, text.data() + i, text.size() - i, &state);
    const bool broken = length == 0 || length > text.size();
    width += broken ? 1 : static_cast<std::size_t>(std::max(0, ::wcwidth(character)));
    i += broken ? 1 : length;
    if (broken) state = {};
  }
  ::uselocale(old);
  return width;
}

void Table::addRow(std::vector<std::string> cells) {
  for (std::string& cell : cells) cell = cell.empty() ? "-" : platform::escapeControlCharacters(cell);
  rows_.push_back(std::move(cells));
}

std::string Table::text() const {
  std::vector<std::size_t> widths(rows_.front().size(), 0);
  for (const auto& row : rows_) {
    for (std::size_t i = 0; i < row.size(); ++i) widths[i] = std::max(widths[i], displayWidth(row[i]));
  }
  std::string out;
  for (const auto& row : rows_) {
    for (std::size_t i = 0; i < row.size(); ++i) {
      out += row[i];
      if (i + 1 < row.size()) out.append(widths[i] - displayWidth(row[i]) + 2, ' ');
    }
    out += '\n';
  }
  return out;
}

}  // namespace tools
