#include <gtest/gtest.h>
#include <sqlite3.h>

#include <filesystem>
#include <sstream>

#include "platform/registrum/Workspace.h"
#include "tests/platform/RegistryFixture.h"

namespace {

using registrum::PlugInRecord;
using registrum::Workspace;
using value::Dictionary;
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

TEST_F(WorkspaceTest, RegistrationStoresTheBundleAndReadsItBack) {
  std::string app = root_.application("Applications/Notes.app", "com.example.notes");
  std::string path =
      root_.plugIn("Applications/Notes.app/PlugIns/Share.appex", "com.example.share");
  root_.writePlist("Applications/Notes.app/PlugIns/Share.appex/Entitlements.plist",
                   Value::dictionary({{"org.annexa.auto-elect-plugin", Value::boolean(true)}}));
  auto record = registerAt(path);
  ASSERT_TRUE(record && record->containingApplication());

  EXPECT_NE(record->uuid(), value::Uuid());
  EXPECT_EQ(record->containingApplication()->path(), app);
  EXPECT_EQ(record->containingApplication()->bundleIdentifier(), "com.example.notes");
  EXPECT_EQ(record->localizedName(), "Display");
  EXPECT_EQ(record->localizedShortName(), "Short");
  EXPECT_EQ(record->entitlements(),
            Dictionary({{"org.annexa.auto-elect-plugin", Value::boolean(true)}}));
  EXPECT_GT(record->registrationDate(), 1.6e9);  // seconds since 1970, not 2001
  EXPECT_EQ(record->dataContainerPath(), root_ / "var/containers/" + record->uuid().string());
  EXPECT_TRUE(fs::is_directory(*record->dataContainerPath()));
  // The plug-in dictionary is resolved; the Info.plist is stored as the bundle holds it.
  EXPECT_EQ(record->valueForKey("QSExtensionVersion", PlugInRecord::Scope::Attributes),
            Value::string("1.0"));
  EXPECT_FALSE(
      record->infoDictionary().find("QSExtension")->asDictionary()->find("QSExtensionAttributes"));
  EXPECT_FALSE(PlugInRecord(PlugInRecord::Fields{})
                   .valueForKey("QSExtensionVersion", PlugInRecord::Scope::Attributes));

  auto byUuid = workspace_->plugInForUuid(record->uuid()).value();
  auto byPath = workspace_->plugInAtPath(path + "/").value();
  ASSERT_TRUE(byUuid && byPath);
  EXPECT_EQ(byUuid->fields().plugInDictionary, record->plugInDictionary());
  EXPECT_EQ(byUuid->entitlements(), record->entitlements());
  EXPECT_EQ(byUuid->registrationDate(), record->registrationDate());
  EXPECT_EQ(byPath->uuid(), record->uuid());
}

TEST_F(WorkspaceTest, IdentifiersAndLocations) {
  auto system = registerAt(root_.plugIn("System/Library/PlugIns/Tool.appex", "tool"));
  auto lookalike = registerAt(root_.plugIn("Systemic/Tool.appex", "tool2"));
  // The application has no Info.plist, which is allowed; it is registered all the same.
  auto named = registerAt(root_.plugIn("Bare.app/PlugIns/Named.appex", "bundle.id", "pt",
                                       {{"QSExtensionIdentifier", Value::string("plugin.id")}}));
  root_.writePlist("Anonymous.appex/Info.plist",
                   Value::dictionary({{"QSExtension", Value::dictionary({})}}));
  auto anonymous = registerAt(root_ / "Anonymous.appex");
  ASSERT_TRUE(system && lookalike && named && anonymous);
  EXPECT_TRUE(system->onSystemPartition());
  EXPECT_FALSE(system->containingApplication());
  EXPECT_FALSE(lookalike->onSystemPartition());
  EXPECT_EQ(named->plugInIdentifier(), "plugin.id");
  EXPECT_EQ(named->bundleIdentifier(), "bundle.id");
  ASSERT_TRUE(named->containingApplication());
  EXPECT_EQ(named->containingApplication()->path(), root_ / "Bare.app");
  EXPECT_FALSE(named->containingApplication()->bundleIdentifier());
  EXPECT_FALSE(anonymous->plugInIdentifier());
  EXPECT_FALSE(anonymous->bundleVersion());
  EXPECT_FALSE(anonymous->localizedName());
  EXPECT_EQ(anonymous->valueForKey("QSExtensionVersion", PlugInRecord::Scope::Attributes),
            Value::string("1"));
}

TEST_F(WorkspaceTest, ReRegistrationKeepsTheUuidAndRefreshesFields) {
  std::string path = root_.plugIn("P.appex", "p");
  auto first = registerAt(path);
  ASSERT_TRUE(first);
  root_.writePlist("P.appex/Info.plist",
                   Value::dictionary({{"QFBundleIdentifier", Value::string("p")},
                                      {"QFBundleShortVersionString", Value::string("2.0")},
                                      {"QSExtension", Value::dictionary({})}}));
  auto second = registerAt(path);
  ASSERT_TRUE(second);
  EXPECT_EQ(second->uuid(), first->uuid());
  EXPECT_EQ(second->bundleVersion(), "2.0");
  EXPECT_EQ(second->dataContainerPath(), first->dataContainerPath());
  EXPECT_EQ(workspace_->listPlugIns().value().size(), 1u);

  auto third = registerAt(path, {.dataContainer = false});
  ASSERT_TRUE(third);
  EXPECT_EQ(third->uuid(), first->uuid());
  EXPECT_FALSE(third->dataContainerPath());
  EXPECT_FALSE(fs::exists(*first->dataContainerPath()));
  EXPECT_FALSE(workspace_->plugInForUuid(first->uuid()).value()->dataContainerPath());
}

TEST_F(WorkspaceTest, UnregisterRemovesRecordAndContainerEvenWhenTheBundleIsGone) {
  std::string path = root_.plugIn("Gone.app/PlugIns/P.appex", "p");
  auto record = registerAt(path);
  ASSERT_TRUE(record);
  fs::remove_all(root_ / "Gone.app");
  ASSERT_TRUE(workspace_->unregisterPlugIn(path).ok());
  EXPECT_FALSE(workspace_->plugInForUuid(record->uuid()).value());
  EXPECT_FALSE(fs::exists(*record->dataContainerPath()));
  EXPECT_TRUE(workspace_->applicationAtPath(root_ / "Gone.app").value());  // the app stays

  EXPECT_EQ(workspace_->unregisterPlugIn(path).error().errnum, ENOENT);
}

TEST_F(WorkspaceTest, BadBundlesFailAndLeaveTheRegistryUnchanged) {
  registerAt(root_.plugIn("Good.app/PlugIns/P.appex", "p"));
  root_.writeFile("Malformed.appex/Info.plist", "<plist><dict><key>x</key>");
  root_.writePlist("WrongExtension.appex/Info.plist",
                   Value::dictionary({{"QSExtension", Value::string("n")}}));
  root_.writePlist("ArrayInfo.appex/Info.plist", Value::array({}));
  root_.plugIn("BadEntitlements.appex", "e");
  root_.writeFile("BadEntitlements.appex/Entitlements.plist", "garbage");
  root_.writeFile("File.appex", "not a directory");
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

TEST_F(WorkspaceTest, FailedInstallsLeaveTheRegistryUnchanged) {
  std::string app = root_.application("A.app", "a");
  root_.plugIn("A.app/PlugIns/One.appex", "one");
  ASSERT_TRUE(workspace_->installApplication(app).ok());
  root_.application("B.app", "b");
  root_.plugIn("B.app/PlugIns/Good.appex", "good");
  root_.writeFile("B.app/PlugIns/Zbad.appex/Info.plist", "not a plist");
  fs::create_directories(root_ / "NoInfo.app");
  fs::create_directories(root_ / "NotAnApp");
  std::string before = snapshot();

  EXPECT_EQ(workspace_->installApplication(app).error().errnum, EEXIST);
  EXPECT_EQ(workspace_->installApplication(root_ / "NoInfo.app").error().errnum, ENOENT);
  EXPECT_EQ(workspace_->installApplication(root_ / "NotAnApp").error().errnum, EINVAL);
  EXPECT_EQ(snapshot(), before);

  // A broken bundle is left out, not the application.
  auto installed = workspace_->installApplication(root_ / "B.app");
  ASSERT_TRUE(installed.ok()) << installed.error().message;
  ASSERT_EQ(installed.value().skipped.size(), 1u);
  EXPECT_EQ(installed.value().skipped[0].path, root_ / "B.app/PlugIns/Zbad.appex");
  EXPECT_EQ(workspace_->plugInsWithinApplication(root_ / "B.app").value().size(), 1u);
}

TEST_F(WorkspaceTest, AFailureInsideTheTransactionRollsBackEarlierWrites) {
  registerAt(root_.plugIn("Kept.appex", "kept"));
  std::string app = root_.application("A.app", "a");
  root_.plugIn("A.app/PlugIns/One.appex", "one");
  fs::remove_all(root_ / "var/containers");
  root_.writeFile("var/containers", "a file where the containers belong");
  std::string before = snapshot();
  EXPECT_EQ(workspace_->installApplication(app).error().errnum, ENOTDIR);
  EXPECT_EQ(workspace_->registerPlugIn(root_ / "A.app/PlugIns/One.appex").error().errnum, ENOTDIR);
  EXPECT_EQ(snapshot(), before);
  EXPECT_FALSE(workspace_->applicationAtPath(app).value());
}

TEST_F(WorkspaceTest, PlaceholdersAreHiddenUntilFinishedAndUninstallTakesThePlugIns) {
  std::string app = root_.application("Beta.app", "beta");
  root_.plugIn("Beta.app/PlugIns/One.appex", "one");
  root_.writeFile("Beta.app/PlugIns/README", "not a bundle");
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

TEST_F(WorkspaceTest, QueryPreselectsPlainStringsAndHonoursTheFilter) {
  root_.plugIn("A.appex", "a", "point.one");
  root_.writePlist("A.appex/Entitlements.plist",
                   Value::dictionary({{"grant", Value::string("yes")}}));
  registerAt(root_ / "A.appex");
  registerAt(root_.plugIn("B.appex", "b", "point.two"));
  root_.writePlist("NoPoint.appex/Info.plist",
                   Value::dictionary({{"QFBundleIdentifier", Value::string("c")},
                                      {"QSExtension", Value::dictionary({})}}));
  registerAt(root_ / "NoPoint.appex");
  root_.plugIn("Attr.appex", "d", "point.two",
               {{"QSExtensionAttributes",
                 Value::dictionary({{"QSExtensionPointIdentifier", Value::string("point.one")}})}});
  registerAt(root_ / "Attr.appex");
  auto identifiers = [&](const Dictionary& rule, const Workspace::Filter& filter = nullptr) {
    std::string out;
    auto records = workspace_->query(rule, filter).value();
    for (const auto& record : records) {
      out += record->plugInIdentifier().value_or("?");
    }
    return out;
  };
  EXPECT_EQ(identifiers({}), "adbc");
  EXPECT_EQ(identifiers({{"QSExtensionIdentifier", Value::string("b")}}), "b");
  EXPECT_EQ(identifiers({{"QSExtensionIdentifier", Value::string("=b")}}), "b");
  EXPECT_EQ(identifiers({{"QSExtensionIdentifier", Value::string("<>b")}}), "adbc");
  // The attribute is what a rule sees, and plug-ins without an extension point stay candidates.
  EXPECT_EQ(identifiers({{"QSExtensionPointIdentifier", Value::string("point.one")}}), "adc");

  std::vector<std::string> seen;
  auto filter = [&](const std::string& identifier, const Dictionary& entitlements) {
    seen.push_back(identifier + (entitlements.find("grant") ? "+" : ""));
    return identifier != "b";
  };
  EXPECT_EQ(identifiers({}, filter), "adc");
  EXPECT_EQ(seen, (std::vector<std::string>{"a+", "d", "b", "c"}));
}

TEST_F(WorkspaceTest, ReopeningKeepsRecordsMigratesAnOldSchemaAndRefusesAnUnknownOneOrAFile) {
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
  // A version 1 database, which kept the plug-in dictionary resolved at registration, is
  // migrated, and its records follow the SDKs of today.
  execute(
      "ALTER TABLE plugins ADD COLUMN plugin_dictionary BLOB NOT NULL DEFAULT x'A0'; "
      "UPDATE schema_version SET version = 1");
  root_.writePlist(
      "System/Library/SDKs/com.example.point.plist",
      Value::dictionary({{"QSExtension", Value::dictionary({{"Sdk", Value::integer(1)}})}}));
  auto migrated = Workspace::open(root_.root());
  ASSERT_TRUE(migrated.ok()) << migrated.error().message;
  auto read = migrated.value()->plugInForUuid(record->uuid()).value();
  EXPECT_EQ(read->valueForKey("Sdk", PlugInRecord::Scope::PlugInDictionary), Value::integer(1));

  execute("UPDATE schema_version SET version = 99");
  auto refused = Workspace::open(root_.root());
  ASSERT_FALSE(refused.ok());
  EXPECT_EQ(refused.error().errnum, EIO);
  EXPECT_NE(refused.error().message.find("99"), std::string::npos);
  EXPECT_EQ(Workspace::open(root_.writeFile("file", "x")).error().errnum, ENOTDIR);
}

}  // namespace
