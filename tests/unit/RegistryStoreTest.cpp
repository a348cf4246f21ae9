#include "platform/registry/RegistryStore.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <random>

#include "tests/support/LogCapture.h"
#include "tests/support/TestPlatform.h"

namespace platform {
namespace {

namespace fs = std::filesystem;

class RegistryStoreTest : public ::testing::Test {
 protected:
  RegistrationPtr registration(const std::string& path) {
    auto bundle = std::make_shared<BundleRegistration>();
    bundle->path = path;
    bundle->uuid = Uuid::random();
    bundle->date = 1234.5;
    bundle->stamp = {{1, 2, -3}, {4, 5, 6}, {7, 8, 9}, {{"de", {10, 11, 12}}}};
    Value deep = "deep";
    for (int i = 0; i < 90; ++i) deep = Array{deep};
    bundle->info = Dictionary{{"deep", deep}, {"big", ~std::uint64_t{0}}, {"path", path}};
    bundle->names = {{"de", "Anzeige", "Name"}};
    return bundle;
  }
  std::string content() {
    std::ifstream file(path_, std::fstream::binary);
    return {std::istreambuf_iterator<char>(file), {}};
  }
  void setContent(const std::string& bytes) {
    for (const char* suffix : {"-wal", "-shm"}) fs::remove(path_ + suffix);
    std::ofstream(path_, std::fstream::binary | std::fstream::trunc) << bytes;
  }

  tests::TemporaryDirectory directory_;
  const std::string path_ = directory_.path("registry.sqlite");
  tests::LogCapture log_;
};

TEST_F(RegistryStoreTest, ADamagedDatabaseIsSetAsideAndBegunAnewNeverReadWrong) {
  std::map<std::string, Uuid> written;
  {
    StoredRegistry stored;
    RegistryStore store(path_, stored);
    StoreChange change;
    for (int i = 0; i < 40; ++i) {
      change.registrations.push_back(registration("/bundle" + std::to_string(i)));
      written[change.registrations.back()->path] = change.registrations.back()->uuid;
    }
    ASSERT_TRUE(store.write(change));
  }
  const std::string good = content();
  ASSERT_GT(good.size(), 8192U);
  std::mt19937 random(7);
  std::size_t setAside = 0;
  const auto check = [&](const std::string& bytes) {
    setContent(bytes);
    {
      StoredRegistry stored;
      RegistryStore store(path_, stored);
      for (const auto& [path, each] : stored.registrations) {
        ASSERT_EQ(written.at(path), each->uuid);
        ASSERT_EQ(each->info["path"].string(), path);
      }
      ASSERT_TRUE(store.write({{registration("/new")}, {}, {}, {}, {}}));
    }
    StoredRegistry stored;
    const RegistryStore store(path_, stored);
    ASSERT_TRUE(stored.registrations.contains("/new"));
    if (fs::remove(path_ + ".damaged")) ++setAside;
  };
  for (int i = 0; i < 30; ++i) {
    std::string bytes = good;
    bytes[random() % bytes.size()] ^= static_cast<char>(1U << random() % 8);
    ASSERT_NO_FATAL_FAILURE(check(bytes));
  }
  for (std::size_t size = 1; size < good.size(); size += good.size() / 8) {
    ASSERT_NO_FATAL_FAILURE(check(good.substr(0, size)));
  }
  ASSERT_NO_FATAL_FAILURE(check("this was never a database"));
  EXPECT_GT(setAside, 20U);
  EXPECT_GE(log_.take().size(), setAside) << "each time it is said";
}

TEST_F(RegistryStoreTest, WithoutADatabaseThatCanBeUsedTheRegistryGoesOn) {
  fs::create_directory(path_);
  StoredRegistry stored;
  RegistryStore store(path_, stored);
  EXPECT_TRUE(store.write({{registration("/a")}, {}, {}, {}, {}}));
  const auto lines = log_.take();
  ASSERT_EQ(lines.size(), 1U);
  EXPECT_TRUE(lines[0].starts_with("ERROR ar: registry database")) << lines[0];
  EXPECT_TRUE(fs::is_directory(path_));
}

}  // namespace
}  // namespace platform
