// The plug-in database of the in-process server: its cache, its query with the election
// restriction, lookups by application, elections and the registry's uninstall notices.

#include <gtest/gtest.h>
#include <sqlite3.h>

#include <algorithm>
#include <future>
#include <set>
#include <string>
#include <vector>

#include "axd/AXDNames.h"
#include "platform/launcher/ServiceLauncher.h"
#include "platform/notify/Notification.h"
#include "tests/axd/InProcessServer.h"
#include "tests/axd/PlugInShelf.h"

namespace {

using value::Dictionary;
using value::Value;

class AXDatabaseTest : public ::testing::Test {
 protected:
  void SetUp() override {
    server_ = InProcessServer::shared().built();
    ASSERT_TRUE(server_);
    shelf_ = std::make_unique<PlugInShelf>(server_);
    since_ = log().logSize();
  }
  void TearDown() override { server_->setCacheLimit(1000000); }

  static InProcessServer& log() { return InProcessServer::shared(); }
  std::size_t logCount(const std::string& text) const {
    auto lines = log().logLines(since_);
    return std::count_if(lines.begin(), lines.end(),
                         [&](const std::string& line) { return line.find(text) != line.npos; });
  }
  // The identifiers of findPlugIns(|rule|), sorted.
  std::set<std::string> found(const Dictionary& rule) {
    std::set<std::string> identifiers;
    auto plugIns = server_->findPlugIns(rule);
    for (const auto& plugIn : plugIns.value()) {
      identifiers.insert(plugIn->identifier().value());
    }
    return identifiers;
  }
  // Stores |annotation| for the plug-in |rgData| without building it through the cache, so no
  // auto-election happens first.
  void annotate(const std::shared_ptr<const registrum::PlugInRecord>& rgData,
                const Dictionary& annotation) {
    server_->setAnnotation(annotation, *AXDPlugIn::initWithRGData(rgData));
  }

  std::shared_ptr<AXDServer> server_;
  std::unique_ptr<PlugInShelf> shelf_;
  std::size_t since_ = 0;
};

TEST_F(AXDatabaseTest, TheCacheIsDroppedWholeWhenItOutgrowsItsLimit) {
  std::vector<std::shared_ptr<const registrum::PlugInRecord>> records;
  for (int i = 0; i < 5; ++i) {
    records.push_back(shelf_->add("Cache", "cache.plugin." + std::to_string(i), "test.cache"));
  }
  server_->setCacheLimit(0);
  ASSERT_TRUE(server_->findPlugIn(records[0]->uuid()));
  EXPECT_EQ(server_->cachedCount(), 1u);  // limit 0 keeps exactly the last record built

  server_->setCacheLimit(2);
  std::vector<std::size_t> counts;
  for (int i = 1; i < 4; ++i) {
    server_->findPlugIn(records[i]->uuid());
    counts.push_back(server_->cachedCount());
  }
  EXPECT_EQ(counts, (std::vector<std::size_t>{2, 3, 1}));
  EXPECT_EQ(logCount("purging cache for 3 > 2"), 1u);

  server_->setCacheLimit(static_cast<std::uint32_t>(-1));  // what "-c -1" sets: never purged
  for (const auto& record : records) server_->findPlugIn(record->uuid());
  EXPECT_EQ(server_->cachedCount(), 5u);
}

TEST_F(AXDatabaseTest, TheElectionEntryRestrictsTheQuery) {
  const std::string point = "test.election";
  annotate(shelf_->add("Elect", "elect.one", point), {{"election", Value::integer(1)}});
  annotate(shelf_->add("Elect", "elect.minus", point), {{"election", Value::integer(-1)}});
  annotate(shelf_->add("Elect", "elect.zero", point), {{"election", Value::integer(0)}});
  shelf_->add("Elect", "elect.none", point);
  const std::set<std::string> all{"elect.one", "elect.minus", "elect.zero", "elect.none"};
  auto S = [](const char* text) { return Value::string(text); };
  struct Case {
    Value election;
    std::set<std::string> expected;
  } cases[] = {
      {S("1"), {"elect.one"}},
      {S("01"), {"elect.one"}},  // numeric-aware, as the rule compares
      {S("-1"), all},            // invalid: no restriction
      {S("255"), {}},            // -1 with bits 8 to 15 cleared is -65281, as the rule reads it
      {Value::array({S("1"), S("=0")}), {"elect.one", "elect.zero", "elect.none"}},
      {Value::array({S("1"), S("")}), all},
      {Value::array({}), {}},
      {Value::integer(1), all},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.election.description());
    EXPECT_EQ(
        found({{"QSExtensionPointIdentifier", S(point.c_str())}, {"QSUserElection", c.election}}),
        c.expected);
  }
}

TEST_F(AXDatabaseTest, AutoElectionElectsOnceAndKeepsTheRestOfTheAnnotation) {
  const Dictionary autoElect{{AXDNames::kAutoElectEntitlement, Value::boolean(true)}};
  auto fresh = shelf_->add("Auto", "auto.fresh", "test.auto", autoElect);
  auto cleared = shelf_->add("Auto", "auto.cleared", "test.auto", autoElect);
  auto chosen = shelf_->add("Auto", "auto.chosen", "test.auto", autoElect);
  const Dictionary extension{{"k", Value::string("v")}};
  annotate(cleared, {{"election", Value::integer(0)}, {"extension", Value::dictionary(extension)}});
  annotate(chosen, {{"election", Value::integer(-1)}});
  std::uint64_t posted =
      notify::Notification::count(AXDNames::kAnnotationChangeNotification).value();

  auto election = [&](const std::shared_ptr<const registrum::PlugInRecord>& rgData) {
    auto annotation = server_->annotationForPlugIn(*server_->findPlugIn(rgData->uuid()));
    return annotation.value().find("election")->integerValue().value();
  };
  EXPECT_EQ(election(fresh), 1);
  EXPECT_EQ(election(cleared), 1);
  EXPECT_EQ(election(chosen), -1);
  auto kept = server_->annotationForPlugIn(*server_->findPlugIn(cleared->uuid()));
  EXPECT_EQ(*kept->find("extension"), Value::dictionary(extension));
  EXPECT_EQ(notify::Notification::count(AXDNames::kAnnotationChangeNotification).value(), posted);
}

TEST_F(AXDatabaseTest, AnInconsistentRegistryRowIsSkippedAndLogged) {
  auto rgData = shelf_->add("Odd", "odd.plugin", "test.odd");
  sqlite3* db = nullptr;
  ASSERT_EQ(sqlite3_open((log().root() + "/var/db/registrum.sqlite").c_str(), &db), SQLITE_OK);
  std::string sql =
      "PRAGMA foreign_keys=OFF; UPDATE applications SET path='/odd/Odd' WHERE path='" +
      rgData->containingApplication()->path() +
      "'; UPDATE plugins SET application_path='/odd/Odd' WHERE uuid='" + rgData->uuid().string() +
      "';";
  EXPECT_EQ(sqlite3_exec(db, sql.c_str(), nullptr, nullptr, nullptr), SQLITE_OK);
  sqlite3_close(db);
  EXPECT_TRUE(found({{"QSExtensionPointIdentifier", Value::string("test.odd")}}).empty());
  EXPECT_EQ(logCount("RG reported containingBundle is not an application"), 1u);
}

TEST_F(AXDatabaseTest, AnUninstallEvictsTheRecordAndWithdrawsItsServices) {
  auto rgData = shelf_->add("Gone", "gone.plugin", "test.gone");
  auto plugIn = server_->findPlugIn(rgData->uuid());
  ASSERT_TRUE(plugIn);
  server_->setAnnotation(Dictionary{{"election", Value::integer(7)}}, *plugIn);
  ASSERT_TRUE(
      launcher::ServiceLauncher::addService(getpid(), "gone.plugin", "1.0", "/bin/sh", {}).ok());
  ASSERT_TRUE(server_->workspace()->unregisterPlugIn(*rgData->bundlePath()).ok());
  ASSERT_TRUE(log().waitForLog("UNINSTALLED:gone.plugin gone.plugin(1.0) " +
                                   rgData->uuid().string() + " " + *rgData->bundlePath(),
                               since_));
  EXPECT_FALSE(server_->findPlugIn(rgData->uuid()));
  auto reinstalled = server_->workspace()->registerPlugIn(*rgData->bundlePath());
  ASSERT_TRUE(reinstalled.ok());
  auto again = server_->findPlugIn(reinstalled.value()->uuid());
  EXPECT_EQ(server_->annotationForPlugIn(*again), (Dictionary{{"election", Value::integer(7)}}));
  // The withdrawal runs on the service queue; a request worked after it sees it done.
  std::promise<void> drained;
  server_->submitWork([&] { drained.set_value(); });
  drained.get_future().wait();
  auto services = launcher::ServiceLauncher::services();
  for (const auto& service : services.value()) {
    EXPECT_NE(service.bundleIdentifier, "gone.plugin");
  }
}

}  // namespace
