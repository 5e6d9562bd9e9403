#include <gtest/gtest.h>
#include <sqlite3.h>

#include <filesystem>
#include <sstream>

#include "platform/registrum/Workspace.h"
#include "tests/platform/RegistryFixture.h"

namespace {

using registrum::PlugInRecord;
using registrum::Workspace;
using value::Value;

namespace fs = std::filesystem;

class WorkspaceTest : public ::testing::Test {
 protected:
  void SetUp() override {
    auto opened = Workspace::open(root_.root());
    ASSERT_TRUE(opened.ok()) << opened.error().message;
    workspace_ = opened.value();
  }

  std::shared_ptr<const PlugInRecord> registerAt(const std::string& path,
                                                 registrum::RegisterOptions options = {}) {
    auto registered = workspace_->registerPlugIn(path, options);
    EXPECT_TRUE(registered.ok()) << registered.error().message;
    return registered.ok() ? registered.value() : nullptr;
  }

  // Everything the registry holds, placeholders included, plus the data containers on disk.
  std::string snapshot() {
    std::ostringstream out;
    auto applications = workspace_->listApplications().value();
    for (const auto& application : applications) {
      out << application->path() << " " << application->isPlaceholder() << "\n";
      auto plugIns = workspace_->plugInsWithinApplication(application->path()).value();
      for (const auto& plugIn : plugIns) {
        out << "  " << plugIn->uuid().string() << " " << *plugIn->bundlePath() << " "
            << plugIn->registrationDate() << "\n";
      }
    }
    auto plugIns = workspace_->listPlugIns().value();
    for (const auto& plugIn : plugIns) {
      out << plugIn->uuid().string() << " " << *plugIn->bundlePath() << "\n";
    }
    std::error_code ignored;
    for (const auto& entry : fs::directory_iterator(root_ / "var/containers", ignored)) {
      out << entry.path().string() << "\n";
    }
    return out.str();
  }

  RegistryFixture root_;
  std::shared_ptr<Workspace> workspace_;
};

TEST_F(WorkspaceTest, BadBundlesFailAndLeaveTheRegistryUnchanged) {
  registerAt(root_.plugIn("Good.app/PlugIns/P.appex", "p"));
  root_.write("Malformed.appex/Info.plist", "<plist><dict><key>x</key>");
  root_.writePlist("WrongExtension.appex/Info.plist",
                   Value::dictionary({{"QSExtension", Value::string("n")}}));
  root_.writePlist("ArrayInfo.appex/Info.plist", Value::array({}));
  root_.plugIn("BadEntitlements.appex", "e");
  root_.write("BadEntitlements.appex/Entitlements.plist", "garbage");
  root_.write("File.appex", "not a directory");
  fs::create_directories(root_ / "Empty.appex");
  std::string before = snapshot();

  struct Case {
    const char* path;
    int errnum;
  };
  for (Case c :
       {Case{"Malformed.appex", EINVAL}, Case{"WrongExtension.appex", EINVAL},
        Case{"ArrayInfo.appex", EINVAL}, Case{"BadEntitlements.appex", EINVAL},
        Case{"File.appex", ENOTDIR}, Case{"Empty.appex", ENOENT}, Case{"Missing.appex", ENOENT}}) {
    auto result = workspace_->registerPlugIn(root_ / c.path);
    ASSERT_FALSE(result.ok()) << c.path;
    EXPECT_EQ(result.error().errnum, c.errnum) << c.path << ": " << result.error().message;
    EXPECT_NE(result.error().message.find(c.path), std::string::npos) << result.error().message;
  }
  EXPECT_EQ(snapshot(), before);
}

TEST_F(WorkspaceTest, AFailureInsideTheTransactionRollsBackEarlierWrites) {
  registerAt(root_.plugIn("Kept.appex", "kept"));
  std::string app = root_.application("A.app", "a");
  root_.plugIn("A.app/PlugIns/One.appex", "one");
  fs::remove_all(root_ / "var/containers");
  root_.write("var/containers", "a file where the containers belong");
  std::string before = snapshot();
  EXPECT_EQ(workspace_->installApplication(app).error().errnum, ENOTDIR);
  EXPECT_EQ(workspace_->registerPlugIn(root_ / "A.app/PlugIns/One.appex").error().errnum, ENOTDIR);
  EXPECT_EQ(snapshot(), before);
  EXPECT_FALSE(workspace_->applicationAtPath(app).value());
}

TEST_F(WorkspaceTest, PlaceholdersAreHiddenUntilFinishedAndUninstallTakesThePlugIns) {
  std::string app = root_.application("Beta.app", "beta");
  root_.plugIn("Beta.app/PlugIns/One.appex", "one");
  root_.write("Beta.app/PlugIns/README", "not a bundle");
  auto installed =
      workspace_->installApplication(app, {.placeholder = true, .dataContainer = false});
  ASSERT_TRUE(installed.ok()) << installed.error().message;
  auto within = workspace_->plugInsWithinApplication(app).value();
  ASSERT_EQ(within.size(), 1u);
  EXPECT_FALSE(within[0]->dataContainerPath());
  EXPECT_TRUE(workspace_->listPlugIns().value().empty());
  EXPECT_TRUE(workspace_->query({}, nullptr).value().empty());

  ASSERT_TRUE(workspace_->finishInstallation(app).ok());
  EXPECT_EQ(workspace_->listPlugIns().value().size(), 1u);
  EXPECT_EQ(workspace_->finishInstallation(app).error().errnum, EINVAL);
  EXPECT_EQ(workspace_->finishInstallation(root_ / "Unknown.app").error().errnum, ENOENT);

  ASSERT_TRUE(workspace_->uninstallApplication(app).ok());
  EXPECT_FALSE(workspace_->applicationAtPath(app).value());
  EXPECT_FALSE(workspace_->plugInForUuid(within[0]->uuid()).value());
  EXPECT_EQ(workspace_->uninstallApplication(app).error().errnum, ENOENT);
}

// How many registry databases were kept aside in |directory|, removing them.
std::size_t setAside(const std::filesystem::path& directory) {
  std::size_t count = 0;
  for (const auto& entry : std::filesystem::directory_iterator(directory)) {
    std::string name = entry.path().filename();
    if (name.find(".damaged-") == std::string::npos) continue;
    count += name.starts_with("registrum.sqlite.damaged-");
    std::filesystem::remove(entry.path());
  }
  return count;
}

TEST_F(WorkspaceTest, ReopeningKeepsRecordsMigratesAnOldSchemaAndSetsAForeignOneAside) {
  auto record = registerAt(root_.plugIn("P.appex", "p"));
  workspace_->clearCaches();
  auto reopened = Workspace::open(root_.root());
  ASSERT_TRUE(reopened.ok());
  EXPECT_EQ(reopened.value()->plugInForUuid(record->uuid()).value()->bundlePath(),
            record->bundlePath());

  auto execute = [&](const char* sql) {
    sqlite3* db = nullptr;
    ASSERT_EQ(sqlite3_open((root_ / "var/db/registrum.sqlite").c_str(), &db), SQLITE_OK);
    sqlite3_busy_timeout(db, 10000);
    EXPECT_EQ(sqlite3_exec(db, sql, nullptr, nullptr, nullptr), SQLITE_OK) << sql;
    sqlite3_close(db);
  };
  // A version 1 database, which kept the plug-in dictionary resolved at registration and knew
  // no signatures, is migrated, and its records follow the SDKs of today.
  execute(
      "ALTER TABLE plugins DROP COLUMN signature; ALTER TABLE plugins DROP COLUMN signer; "
      "ALTER TABLE plugins DROP COLUMN signature_note; "
      "ALTER TABLE plugins DROP COLUMN executable_digest; "
      "ALTER TABLE plugins ADD COLUMN plugin_dictionary BLOB NOT NULL DEFAULT x'A0'; "
      "UPDATE schema_version SET version = 1");
  root_.writePlist(
      "System/Library/SDKs/com.example.point.plist",
      Value::dictionary({{"QSExtension", Value::dictionary({{"Sdk", Value::integer(1)}})}}));
  auto migrated = Workspace::open(root_.root());
  ASSERT_TRUE(migrated.ok()) << migrated.error().message;
  auto read = migrated.value()->plugInForUuid(record->uuid()).value();
  EXPECT_EQ(read->valueForKey("Sdk", PlugInRecord::Scope::PlugInDictionary), Value::integer(1));

  EXPECT_EQ(setAside(root_ / "var/db"), 0u);

  // A later version, or another program's tables, is kept aside and an empty registry started.
  for (const char* sql : {"UPDATE schema_version SET version = 99",
                          "DROP TABLE schema_version; CREATE TABLE other (x)"}) {
    execute(sql);
    auto fresh = Workspace::open(root_.root());
    ASSERT_TRUE(fresh.ok()) << fresh.error().message;
    EXPECT_TRUE(fresh.value()->listPlugIns().value().empty());
    EXPECT_EQ(setAside(root_ / "var/db"), 1u) << sql;
  }
  EXPECT_EQ(Workspace::open(root_.write("file", "x")).error().errnum, ENOTDIR);
}

}  // namespace
