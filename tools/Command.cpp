#include "tools/Command.h"

#include <cstdio>

#include "platform/log/Log.h"

namespace tools {

void complain(const std::string& text) {
  std::fputs(("xtctl: " + platform::escapeControlCharacters(text) + "\n").c_str(), stderr);
}

}  // namespace tools
