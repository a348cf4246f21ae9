#include "platform/log/Log.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <stdlib.h>
#include <sys/stat.h>

#include <array>

#include "platform/files/UniqueFd.h"
#include "platform/log/StandardLogSink.h"
#include "tests/support/LogCapture.h"

namespace platform {
namespace {

constexpr const char* kSubsystem = "com.example.test";

std::string readSome(int fd) {
  struct pollfd ready = {fd, POLLIN, 0};
  std::array<char, 4096> buffer{};
  const ssize_t size = ::poll(&ready, 1, 10'000) == 1 ? ::read(fd, buffer.data(), buffer.size()) : 0;
  return {buffer.data(), static_cast<std::size_t>(std::max<ssize_t>(size, 0))};
}

TEST(LogTest, ALineIsOneLineOfTextWhateverIsInIt) {
  std::array<int, 2> ends{};
  ASSERT_EQ(::pipe2(ends.data(), O_CLOEXEC), 0);
  const UniqueFd reader(ends[0]);
  const UniqueFd writer(ends[1]);
  StandardLogSink sink(writer.get(), "");
  sink.write("s", "ops", LogLevel::Error, "a\nb\t\x1b[31m \x7f \\ gr\xC3\xBC\xC3\x9F \xC2\x9B \xFF\xC3");
  EXPECT_EQ(readSome(reader.get()),
            "ERROR ops: a\\x0ab\\x09\\x1b[31m \\x7f \\ gr\xC3\xBC\xC3\x9F \\xc2\\x9b \\xff\\xc3\n");
  sink.write("", "-", LogLevel::Default, "");
  EXPECT_EQ(readSome(reader.get()), "DEFAULT -: \n");
}

TEST(LogTest, TheJournalGetsFieldsWhenStandardErrorIsIts) {
  EXPECT_EQ(
      StandardLogSink::journalFields(kSubsystem, "ops", LogLevel::Fault, "a=b\n"),
      (std::array<std::string, 4>{"MESSAGE=a=b\\x0a", "PRIORITY=2", "CATEGORY=ops", "SUBSYSTEM=com.example.test"}));
  std::string priorities;
  for (const auto level : {LogLevel::Debug, LogLevel::Info, LogLevel::Default, LogLevel::Error}) {
    priorities += StandardLogSink::journalFields("", "-", level, "")[1].back();
  }
  EXPECT_EQ(priorities, "7653");

  std::array<int, 2> ends{};
  ASSERT_EQ(::pipe2(ends.data(), O_CLOEXEC), 0);
  const UniqueFd reader(ends[0]);
  const UniqueFd writer(ends[1]);
  struct stat status {};
  ASSERT_EQ(::fstat(writer.get(), &status), 0);
  EXPECT_TRUE(StandardLogSink::isJournal(writer.get(), fmt::format("{}:{}", status.st_dev, status.st_ino)));
  EXPECT_FALSE(StandardLogSink::isJournal(writer.get(), fmt::format("{}:{}", status.st_dev, status.st_ino + 1)));
  EXPECT_FALSE(StandardLogSink::isJournal(writer.get(), ""));
}

// Counts how often it is asked for its text.
struct Costly {
  std::string describe() const {
    ++*asked;
    return "costly";
  }
  int* asked;
};

TEST(LogTest, LevelsAreSetForAllAndByCategory) {
  tests::LogCapture capture("debug");
  const Log* ops = Log::named(kSubsystem, "test-ops");
  const Log* ar = Log::named(kSubsystem, "test-ar");
  Log::configure("error, test-ops=info,test-ar=loud,=debug,nonsense");
  int asked = 0;
  ops->debug("{}", Costly{&asked});
  EXPECT_EQ(asked, 0) << "formatted though nobody sees it";
  ops->info("{}", Costly{&asked});
  ar->def("lost");
  ar->error("kept");
  Log::processDefault().def("lost");
  Log::configure("");
  ar->info("lost");
  ar->def("kept too");
  EXPECT_EQ(capture.take(),
            (std::vector<std::string>{"INFO test-ops: costly", "ERROR test-ar: kept", "DEFAULT test-ar: kept too"}));
}

}  // namespace
}  // namespace platform
