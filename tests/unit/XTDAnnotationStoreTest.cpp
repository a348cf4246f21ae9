#include "xtd/XTDAnnotationStore.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cmath>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <sstream>

#include "platform/files/PosixFiles.h"
#include "platform/value/InternalInconsistency.h"
#include "tests/support/LogCapture.h"
#include "tests/support/PrintDescribed.h"
#include "tests/support/TestPlatform.h"
#include "xtd/XTDPlugIn.h"

namespace extora {
namespace {

using Lines = std::vector<std::string>;

constexpr const char* kOldFile =
    "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist "
    "version=\"1.0\"><dict><key>data</key><dict><key>com.a</key><dict>"
    "<key>election</key><integer>1</integer><key>other</key><string>kept</string></dict></dict>"
    "<key>version</key><integer>16</integer></dict></plist>\n";
const Dictionary kOldMap{{"com.a", Dictionary{{"election", 1}, {"other", "kept"}}}};

// How many characters of one description stand for others in the other one.
int differentCharacters(const Dictionary& a, const Dictionary& b) {
  std::array<int, 256> counts{};
  for (const char c : Value(a).describe()) ++counts[static_cast<unsigned char>(c)];
  for (const char c : Value(b).describe()) --counts[static_cast<unsigned char>(c)];
  int more = 0;
  int fewer = 0;
  for (const int count : counts) (count > 0 ? more : fewer) += std::abs(count);
  return std::max(more, fewer);
}

// A disk that fails at one step of a write, and takes 200 bytes at once.
class FailingFiles : public platform::PosixFiles {
 public:
  int failAt = 0;  // the how-manieth step from now; 0: none

 protected:
  int openDirectory(const char* path) override { return fails() ? -1 : PosixFiles::openDirectory(path); }
  int openTemporary(int directory, const char* name) override {
    return fails() ? -1 : PosixFiles::openTemporary(directory, name);
  }
  ssize_t writeSome(int fd, const std::uint8_t* bytes, std::size_t size) override {
    return fails() ? -1 : PosixFiles::writeSome(fd, bytes, std::min<std::size_t>(size, 200));
  }
  int syncFile(int) override { return fails() ? -1 : 0; }  // nothing here has to outlive the machine
  int renameFile(int directory, const char* from, const char* to) override {
    return fails() ? -1 : PosixFiles::renameFile(directory, from, to);
  }
  int syncDirectory(int) override { return fails() ? -1 : 0; }
  std::optional<Error> linkFile(const std::string& from, const std::string& to) override {
    if (fails()) return platform::posixError(errno, "link");
    return PosixFiles::linkFile(from, to);
  }

 private:
  bool fails() {
    errno = ENOSPC;
    return failAt > 0 && --failAt == 0;
  }
};

class XTDAnnotationStoreTest : public ::testing::Test {
 protected:
  XTDAnnotationStoreTest() {
    platform_.services->files = files_;
    plugIn_ =
        XTDPlugIn::initWithARData(platform_.registry->install(tests::sampleRecord("com.a")), platform_.registry, {});
  }
  std::unique_ptr<XTDAnnotationStore> open(std::optional<std::string> path) {
    return XTDAnnotationStore::initWithDatabase(platform_.services, path);
  }
  std::unique_ptr<XTDAnnotationStore> open() { return open(path_); }
  static void write(const std::string& path, std::string_view text) {
    std::ofstream(path, std::fstream::binary | std::fstream::trunc) << text;
  }
  static std::string read(const std::string& path) {
    std::ostringstream text;
    text << std::ifstream(path, std::fstream::binary).rdbuf();
    return text.str();
  }

  tests::TestPlatform platform_;
  std::shared_ptr<FailingFiles> files_ = std::make_shared<FailingFiles>();
  std::string path_ = platform_.directory.path("db");
  std::string url_ = "file://" + path_;
  std::shared_ptr<XTDPlugIn> plugIn_;
};

TEST_F(XTDAnnotationStoreTest, AFirstStartIsSilentAndMakesTheFileWithTheFirstChange) {
  tests::LogCapture log("info");
  auto store = open();
  EXPECT_TRUE(store->annotations().empty());
  EXPECT_FALSE(std::filesystem::exists(path_));
  EXPECT_TRUE(store->annotationForPlugIn(*plugIn_).isNothing());
  store->setAnnotation(Dictionary{{"election", 1}}, *plugIn_);
  EXPECT_EQ(log.take(), Lines());
  EXPECT_EQ(read(path_),
            "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n<dict>\n\t<key>data</key>\n\t<dict>\n"
            "\t\t<key>com.a</key>\n\t\t<dict>\n\t\t\t<key>election</key>\n\t\t\t<integer>1</integer>\n\t\t</dict>\n"
            "\t</dict>\n\t<key>version</key>\n\t<integer>16</integer>\n</dict>\n</plist>\n");
  EXPECT_EQ(open()->annotations(), store->annotations());
}

TEST_F(XTDAnnotationStoreTest, AnotherVersionIsResetAndKeptOnceBesideTheFile) {
  std::string other = kOldFile;
  other.replace(other.find("16"), 2, "15");
  write(path_, other);
  tests::LogCapture log("info");
  auto store = open();
  EXPECT_EQ(log.take(), Lines({"ERROR ops: unable to load annotation database:" + url_ +
                               " error:Extora 7: found database version 15 needed version 16 (resetting)"}));
  EXPECT_EQ(read(path_), other) << "untouched until the first change";
  EXPECT_FALSE(std::filesystem::exists(path_ + ".damaged"));
  store->setAnnotation(Dictionary{{"election", 3}}, *plugIn_);
  store->setAnnotation(Dictionary{{"election", 4}}, *plugIn_);
  EXPECT_EQ(read(path_ + ".damaged"), other);
  EXPECT_EQ(open()->annotations(), Dictionary({{"com.a", Dictionary{{"election", 4}}}}));
  write(path_, "later damage");
  open()->setAnnotation(Dictionary{{"election", 5}}, *plugIn_);
  EXPECT_EQ(read(path_ + ".damaged"), other) << "once: the first one stays";
}

// What loads is the old content or nothing, whatever became of the file; and the store works on afterwards.
TEST_F(XTDAnnotationStoreTest, ACutOrFlippedFileLoadsWholeOrNotAtAll) {
  const std::string whole = kOldFile;
  const auto usable = [&](std::string_view text) {
    write(path_, text);
    auto store = open();
    const Dictionary loaded = store->annotations();
    store->setAnnotation(Dictionary{{"election", 9}}, *plugIn_);
    EXPECT_EQ(open()->annotationForPlugIn(*plugIn_)["election"], Value(9));
    return loaded;
  };
  tests::LogCapture log("fault");
  for (std::size_t length = 0; length < whole.size(); ++length) {
    const bool complete = length == whole.size() - 1;  // only the line end is missing
    EXPECT_EQ(usable(whole.substr(0, length)), complete ? kOldMap : Dictionary()) << length;
  }
  for (std::size_t at = 0; at < whole.size(); ++at) {
    std::string flipped = whole;
    flipped[at] = static_cast<char>(flipped[at] ^ (1 << at % 8));
    const Dictionary loaded = usable(flipped);
    if (loaded.empty()) continue;
    EXPECT_LE(differentCharacters(loaded, kOldMap), 1) << at << " " << Value(loaded).describe();
  }
}

TEST_F(XTDAnnotationStoreTest, AFaultAtAnyStepOfASaveLeavesTheOldFileAndMemoryAhead) {
  for (const bool damaged : {false, true}) {
    const std::string old = damaged ? "damaged" : kOldFile;
    int step = 1;
    for (bool failed = true; failed; ++step) {
      std::filesystem::remove(path_ + ".damaged");
      write(path_, old);
      tests::LogCapture log;
      auto store = open();
      (void)log.take();
      files_->failAt = step;
      store->setAnnotation(Dictionary{{"election", 5}}, *plugIn_);
      failed = files_->failAt == 0;
      files_->failAt = 0;
      EXPECT_EQ(store->annotationForPlugIn(*plugIn_)["election"], Value(5)) << step;
      const Lines lines = log.take();
      ASSERT_EQ(lines.size(), failed ? 1U : 0U) << step;
      if (failed) {
        const std::string start = "ERROR ops: unable to save annotations:" + url_ + " error:POSIX 28: ";
        EXPECT_EQ(lines[0].substr(0, start.size()), start);
      }
      EXPECT_FALSE(std::filesystem::exists(path_ + ".tmp")) << step;
      const std::string left = read(path_);
      EXPECT_TRUE(left == old || open()->annotations() == store->annotations()) << step;
      EXPECT_TRUE(!damaged || left == old || read(path_ + ".damaged") == old) << step;
      store->setAnnotation(Dictionary{{"extension", Dictionary()}}, *plugIn_);
      EXPECT_EQ(open()->annotations(), store->annotations()) << "the next save writes what the failed one did not";
    }
    EXPECT_EQ(step, damaged ? 10 : 9) << "every step was made to fail once";
  }
}

TEST_F(XTDAnnotationStoreTest, MigratesFromTheOtherPlace) {
  const std::string container = platform_.directory.path("container");
  const std::string global = platform_.directory.path("global");
  write(global, kOldFile);
  {
    tests::LogCapture log("info");
    EXPECT_TRUE(open()->annotations().empty()) << "in single-user mode the container never loads";
    EXPECT_EQ(platform_.containers->asked, 1);
    EXPECT_EQ(open(std::nullopt)->annotationsURL().path(), global);
    EXPECT_EQ(log.take(), Lines());
  }
  platform_.containers->multiUser = true;
  tests::LogCapture log("info");
  auto store = open(std::nullopt);
  EXPECT_EQ(store->annotationsURL().path(), container + "/com.orvane.extora/Annotations");
  EXPECT_EQ(store->annotations(), kOldMap);
  EXPECT_EQ(log.take(), Lines({"INFO ops: migrating shared annotations"}));
  struct stat status {};
  ASSERT_EQ(stat((container + "/com.orvane.extora").c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777, 0700U);
  std::filesystem::remove(global);
  EXPECT_EQ(open(std::nullopt)->annotations(), kOldMap) << "saved to its own place";

  write(global, kOldFile);
  files_->failAt = 1;
  EXPECT_EQ(open()->annotations(), kOldMap);
  const Lines lines = log.take();
  ASSERT_EQ(lines.size(), 2U);
  const std::string start = "ERROR ops: unable to save migrated annotations to " + url_ + " error:POSIX 28: ";
  EXPECT_EQ(lines[1].substr(0, start.size()), start);
}

TEST_F(XTDAnnotationStoreTest, WithoutItsContainerTheDaemonCannotStart) {
  tests::LogCapture log;
  const auto textOf = [](const std::function<void()>& work) -> std::string {
    try {
      work();
    } catch (const platform::InternalInconsistency& broken) {
      return broken.what();
    }
    return "nothing was thrown";
  };
  platform_.containers->answer = std::uint64_t{0};
  EXPECT_EQ(textOf([&] { open(); }), "unable to locate user container: error 1") << "the migration asks for it";
  EXPECT_EQ(log.take(), Lines({"ERROR ops: failed to get storage container: error=1"}));
  platform_.containers->multiUser = true;
  platform_.containers->answer = std::uint64_t{13};
  EXPECT_EQ(textOf([&] { open(std::nullopt); }), "unable to locate user container: error 13");
  write(path_, "not a directory");
  platform_.containers->answer = path_;
  const std::string text = textOf([&] { open(std::nullopt); });
  const std::string start =
      "unable to create plugin annotations directory:" + path_ + "/com.orvane.extora error:POSIX ";
  EXPECT_EQ(text.substr(0, start.size()), start);
}

}  // namespace
}  // namespace extora
