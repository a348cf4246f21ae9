// xtctl lint over folders of bundles (tests/system/lint): each has a file expected.txt with the command line, what it
// prints, and its exit status.
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <sstream>

#include "tests/support/Daemon.h"

namespace extora {
namespace {

namespace fs = std::filesystem;

std::string textOf(const fs::path& path) {
  std::ifstream file(path);
  return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
}

void replaceAll(std::string& text, const std::string& from, const std::string& to) {
  for (auto at = text.find(from); at != std::string::npos; at = text.find(from, at + to.size())) {
    text.replace(at, from.size(), to);
  }
}

class LintTest : public ::testing::TestWithParam<const char*> {};

TEST_P(LintTest, FindsWhatIsExpected) {
  const tests::Daemon place;  // its folders; no daemon is started
  const fs::path folder = place.root() / GetParam();
  fs::copy(fs::path(LINT_BUNDLES) / GetParam(), folder, fs::copy_options::recursive | fs::copy_options::copy_symlinks);
  // What a checkout does not keep: who may write.
  for (const auto& entry : fs::recursive_directory_iterator(folder)) {
    if (entry.is_symlink()) continue;
    const bool writable = entry.path().string().find("Writable.appex/Entitlements") != std::string::npos;
    fs::permissions(entry.path(), fs::perms::group_write | fs::perms::others_write,
                    writable ? fs::perm_options::add : fs::perm_options::remove);
  }
  const std::string expected = textOf(folder / "expected.txt");
  std::istringstream words(expected.substr(2, expected.find('\n')));
  std::vector<std::string> command{"/bin/sh", "-c", "cd \"$0\" && exec \"$@\" 2>&1", folder, XTCTL_BINARY};
  std::string line;
  std::getline(words, line);
  std::istringstream arguments(line);
  for (std::string word; arguments >> word;) command.push_back(word);

  auto environment = place.environment();
  environment["EXTORA_LOG"] = "fault";
  environment["EXTORA_PROFILES"] = fs::exists(folder / "profiles") ? (folder / "profiles").string() : PROFILES;
  tests::RunningProgram lint(command, environment, STDOUT_FILENO);
  const int status = lint.wait();
  std::string said = "$ " + line + "\n" + lint.output() + "exit " + std::to_string(status) + "\n";
  replaceAll(said, folder.string() + "/", "");
  EXPECT_EQ(said, expected);
}

INSTANTIATE_TEST_SUITE_P(Bundles, LintTest,
                         ::testing::Values("good", "left-out", "keys", "profiles", "names", "trust"));

}  // namespace
}  // namespace extora
