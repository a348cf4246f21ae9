#include "xtd/XTDatabase.h"

#include <gtest/gtest.h>

#include <algorithm>

#include "tests/support/LogCapture.h"
#include "tests/support/PrintDescribed.h"
#include "tests/support/TestPlatform.h"

namespace extora {
namespace {

using platform::ARExtoraProxy;
using platform::Array;
using platform::PlugInRecord;
using tests::sampleRecord;
using Lines = std::vector<std::string>;

platform::ARApplicationProxy application(const char* path, bool isPlaceholder) {
  platform::ARApplicationProxy record;
  record.bundleURL = Url::file(path);
  record.isPlaceholder = isPlaceholder;
  return record;
}

class XTDatabaseTest : public ::testing::Test {
 protected:
  XTDatabaseTest() : database_(XTDatabase::initWithDatabase(platform_.services, platform_.directory.path("db"))) {
    database_->setCacheLimit(1'000);
  }
  std::shared_ptr<XTDPlugIn> install(const ARExtoraProxy& record) {
    return database_->plugInForProxy(registry_.install(record));
  }
  /// The identifiers that a query finds, sorted.
  std::vector<std::string> found(const Value& query) {
    std::vector<std::string> identifiers;
    const XTDatabase::PlugIns plugIns = database_->findPlugIns(query).value();
    for (const auto& plugIn : plugIns) identifiers.push_back(plugIn->identifier());
    std::sort(identifiers.begin(), identifiers.end());
    return identifiers;
  }
  /// Waits until the database's queue has done what was submitted to it.
  void drain() {
    database_->_sync().sync([] {});
  }

  tests::TestPlatform platform_;
  tests::FakeRegistry& registry_ = *platform_.registry;
  std::shared_ptr<XTDatabase> database_;
};

TEST_F(XTDatabaseTest, TheCacheIsEmptiedWholeBeforeItPassesItsLimit) {
  database_->setCacheLimit(2);
  const auto first = install(sampleRecord("com.a"));
  install(sampleRecord("com.b"));
  install(sampleRecord("com.c"));
  EXPECT_EQ(database_->cacheCount(), 3U);
  EXPECT_EQ(database_->findPlugIn(first->uuid()), first);
  EXPECT_EQ(registry_.clears, 0);
  tests::LogCapture log("info");
  install(sampleRecord("com.d"));
  EXPECT_EQ(log.take(), Lines({"DEFAULT ops: createPlugInForProxy", "INFO ops: purging cache for 3 > 2"}));
  EXPECT_EQ(database_->cacheCount(), 1U);
  EXPECT_EQ(registry_.clears, 1);
  EXPECT_NE(database_->findPlugIn(first->uuid()), first);

  database_->setCacheLimit(0);
  const auto last = install(sampleRecord("com.e"));
  EXPECT_EQ(database_->cacheCount(), 1U);
  EXPECT_EQ(database_->findPlugIn(last->uuid()), last) << "a look-up of a cached plug-in does not purge";
}

TEST_F(XTDatabaseTest, ALocaleChangeFlushesEverything) {
  const auto before = install(sampleRecord("com.a"));
  tests::LogCapture log("info");
  platform_.locale->change();
  drain();
  EXPECT_EQ(log.take(),
            Lines({"DEFAULT ops: locale change detected; purging cache", "INFO ops: purging cache for 1 > 0"}));
  EXPECT_EQ(registry_.clears, 1);
  platform_.locale->change();
  drain();
  EXPECT_EQ(registry_.clears, 1) << "an empty cache leaves the registry's caches alone";
  EXPECT_NE(database_->findPlugIn(before->uuid()), before);
}

TEST_F(XTDatabaseTest, LeavesOutWhatCannotBeUsed) {
  registry_.install(sampleRecord("com.good"));
  ARExtoraProxy noURL = sampleRecord("com.nourl");
  noURL.bundleURL.reset();
  registry_.install(noURL);
  registry_.install(application("/Apps/P.app", true), {sampleRecord("com.placeholder")});
  ARExtoraProxy broken = sampleRecord("com.broken");
  broken.dataContainerURL.reset();
  registry_.install(broken);
  ARExtoraProxy nameless = sampleRecord("com.nouuid");
  nameless.plugInUUID.reset();
  registry_.install(nameless);
  ARExtoraProxy outside = sampleRecord("com.outside");
  outside.bundleURL = Url::file("/System/com.outside.appex");
  registry_.install(std::nullopt, {outside});

  tests::LogCapture log("info");
  EXPECT_EQ(found(Value()), Lines({"com.good", "com.outside"}));
  const Lines lines = log.take();
  for (const char* line : {"INFO ops: skipping ar proxy com.nourl at ? with nil bundleURL",
                           "INFO ops: skipping ar proxy com.placeholder at "
                           "/Apps/com.placeholder.app/PlugIns/com.placeholder.appex because its app is a placeholder",
                           "ERROR ops: Expected pluginUUID to be non-nil."}) {
    EXPECT_EQ(std::count(lines.begin(), lines.end(), line), 1) << line;
  }
  EXPECT_EQ(found(Dictionary{{"x", true}}), Lines({"com.good", "com.outside"}));
  EXPECT_EQ(database_->cacheCount(), 2U);
}

TEST_F(XTDatabaseTest, ElectionFilters) {
  const std::string automatic(XTAutoElectEntitlement);
  const std::string replaces(XTOverrideEntitlement);
  // None of these is built before the queries, so that auto-election has not stored anything yet.
  registry_.install(sampleRecord("none"));
  registry_.install(sampleRecord("auto0", {}, Dictionary{{automatic, false}}));
  registry_.install(sampleRecord("stand-in", {}, Dictionary{{replaces, "two"}}));
  const auto annotate = [&](const char* identifier, std::int64_t election) {
    database_->setAnnotation(Dictionary{{"election", election}}, *install(sampleRecord(identifier)));
  };
  annotate("one", 1);
  annotate("two", 2);
  annotate("257", 257);
  annotate("minus", -1);
  const Lines all{"257", "auto0", "minus", "none", "one", "stand-in", "two"};
  const struct {
    Value filter;
    Lines expected;
  } rows[] = {
      {"1", {"257", "one"}},
      {"=2", {"stand-in", "two"}},
      {Array{"=1", "2"}, {"257", "one", "stand-in", "two"}},
      {"0", {"auto0", "none"}},
      {"255", {"minus"}},
      {"\xC3\xA9", {}},  // a letter, though not an ASCII one
      {Array(), {}},
      {Array{"1", "-1"}, all},
      {Array{"1", 2}, all},
      {"+1", all},
      {"<>1", all},
      {"\xE2\x82\xAC", all},  // a sign
      {"", all},
      {"=", {}},
      {1, all},
      {true, all},
  };
  for (const auto& row : rows) {
    EXPECT_EQ(found(Dictionary{{"HXUserElection", row.filter}}), row.expected) << row.filter.describe();
  }
  EXPECT_EQ(found(Dictionary()), all);

  registry_.install(sampleRecord("auto1", {}, Dictionary{{automatic, 1}}));
  tests::LogCapture log("ops=debug");
  EXPECT_EQ(found(Dictionary{{"HXUserElection", "1"}}), Lines({"257", "auto1", "one"}));
  const Lines lines = log.take();
  for (const char* line : {"DEBUG ops: ar filter auto1 -> 1", "DEBUG ops: ar filter none -> 0",
                           "DEBUG ops: AR reported 3 plug-ins (cache 7/8)"}) {
    EXPECT_EQ(std::count(lines.begin(), lines.end(), line), 1) << line;
  }
}

TEST_F(XTDatabaseTest, ARecordFromBeforeAnUninstallDoesNotBringThePlugInBack) {
  const PlugInRecord held = registry_.install(sampleRecord("com.a"));
  ASSERT_TRUE(database_->plugInForProxy(held));
  registry_.uninstall(*held->plugInUUID, true);
  EXPECT_EQ(database_->cacheCount(), 0U);
  EXPECT_FALSE(database_->plugInForProxy(held));
  EXPECT_EQ(database_->cacheCount(), 0U);
}

}  // namespace
}  // namespace extora
