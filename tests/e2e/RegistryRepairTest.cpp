// The registry after bad luck, through rgctl and the real daemon: a record that no longer decodes,
// a database file that is no registry, and data containers left by a killed rgctl.

#include <sqlite3.h>

#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "tests/e2e/Bundles.h"
#include "tests/e2e/DaemonTest.h"

namespace {

namespace fs = std::filesystem;
using Ids = std::vector<std::string>;

class RegistryRepairTest : public DaemonTest {
 protected:
  Subprocess::Outcome rgctl(std::vector<std::string> arguments) {
    arguments.insert(arguments.begin(), {"--root", root()});
    return Subprocess::run(RGCTL_EXECUTABLE, arguments, {{"AXD_LOG", "stderr"}});
  }

  // Registers a plug-in of the application "Lib.app"; returns its path.
  std::string registerPlugIn(const std::string& id) {
    std::string path = bundles::plugIn(root() + "/Applications", "Lib", {.id = id});
    Subprocess::Outcome registered = rgctl({"register", path});
    EXPECT_EQ(registered.status, 0) << registered.err;
    return path;
  }

  // Overwrites the Info.plist kept in the registry row of |path| with bytes that do not decode.
  void damage(const std::string& path) {
    sqlite3* db = nullptr;
    ASSERT_EQ(sqlite3_open((root() + "/var/db/registrum.sqlite").c_str(), &db), SQLITE_OK);
    sqlite3_busy_timeout(db, 10000);
    sqlite3_stmt* update = nullptr;
    ASSERT_EQ(sqlite3_prepare_v2(db, "UPDATE plugins SET info = x'ff00ff' WHERE path = ?", -1,
                                 &update, nullptr),
              SQLITE_OK);
    sqlite3_bind_text(update, 1, path.c_str(), -1, SQLITE_TRANSIENT);
    EXPECT_EQ(sqlite3_step(update), SQLITE_DONE);
    EXPECT_EQ(sqlite3_changes(db), 1) << path;
    sqlite3_finalize(update);
    sqlite3_close(db);
  }

  std::string containers() const { return root() + "/var/containers/"; }
};

TEST_F(RegistryRepairTest, ADamagedRecordHidesItselfAndRgctlRemovesOrReplacesIt) {
  ASSERT_TRUE(start());
  std::string a = registerPlugIn("a");
  std::string b = registerPlugIn("b");
  std::string c = registerPlugIn("c");
  std::string app = root() + "/Applications/Suite.app";
  std::string inApp = bundles::plugIn(root() + "/Applications", "Suite", {.id = "suite.one"});
  ASSERT_EQ(rgctl({"install", app}).status, 0);
  std::string bUuid = uuid(b).string();
  std::string cUuid = uuid(c).string();
  std::string inAppUuid = uuid(inApp).string();
  damage(b);
  damage(c);
  damage(inApp);
  ASSERT_TRUE(restart());

  EXPECT_EQ(matchIds(), (Ids{"a"}));
  EXPECT_EQ(logCount("at " + b + ": "), 1u) << daemon().log();
  EXPECT_EQ(matchIds(), (Ids{"a"}));
  EXPECT_EQ(logCount("at " + b + ": "), 1u) << "one line per damaged record";

  Subprocess::Outcome listed = rgctl({"list"});
  EXPECT_EQ(listed.status, 0) << listed.err;
  EXPECT_NE(listed.out.find(a), std::string::npos) << listed.out;
  for (const auto& [path, id] : {std::pair{b, bUuid}, {c, cUuid}, {inApp, inAppUuid}}) {
    EXPECT_NE(listed.out.find("damaged " + path + " " + id + "\n"), std::string::npos)
        << listed.out;
  }

  // Removed by path without being read, with its data container.
  EXPECT_EQ(rgctl({"unregister", b}).out, "ok\n");
  EXPECT_FALSE(fs::exists(containers() + bUuid));
  EXPECT_EQ(rgctl({"uninstall", app}).out, "ok\n");
  EXPECT_FALSE(fs::exists(containers() + inAppUuid));
  // Registered again: the same UUID and data container, and found again.
  Subprocess::Outcome again = rgctl({"register", c});
  EXPECT_EQ(again.out, cUuid + "\n") << again.err;
  EXPECT_TRUE(fs::is_directory(containers() + cUuid));
  EXPECT_EQ(matchIds(), (Ids{"a", "c"}));
  EXPECT_EQ(rgctl({"list"}).out.find("damaged"), std::string::npos);
}

TEST_F(RegistryRepairTest, AGarbageDatabaseIsKeptAsideAndTheRegistryRebuilt) {
  ASSERT_TRUE(start());
  std::string oldContainer = containers() + uuid(registerPlugIn("old")).string();
  std::string database = root() + "/var/db/registrum.sqlite";
  for (const char* part : {"", "-wal", "-shm"}) fs::remove(database + part);
  const std::string garbage(4096, 'x');
  std::ofstream(database) << garbage;
  ASSERT_TRUE(restart());
  expectServing();

  std::string a = registerPlugIn("a");
  EXPECT_EQ(matchIds(), (Ids{"a"}));
  EXPECT_EQ(logCount("started an empty registry"), 1u) << daemon().log();
  std::vector<std::string> kept;
  for (const auto& entry : fs::directory_iterator(root() + "/var/db")) {
    std::string name = entry.path().filename();
    if (name.starts_with("registrum.sqlite.damaged-")) {
      std::ifstream file(entry.path());
      kept.emplace_back(std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>());
    }
  }
  EXPECT_EQ(kept, (Ids{garbage}));
  // The containers of the kept records go with them rather than being reclaimed as orphans.
  EXPECT_FALSE(fs::exists(oldContainer));
  std::size_t keptContainers = 0;
  for (const auto& entry : fs::directory_iterator(root() + "/var")) {
    if (!entry.path().filename().string().starts_with("containers.damaged-")) continue;
    keptContainers += fs::is_directory(entry.path() / fs::path(oldContainer).filename());
  }
  EXPECT_EQ(keptContainers, 1u);
}

TEST_F(RegistryRepairTest, OrphanDataContainersAreReclaimedAndOthersKept) {
  ASSERT_TRUE(start());
  std::string a = registerPlugIn("a");
  std::string aContainer = containers() + uuid(a).string();
  std::string orphan = containers() + value::Uuid::random().string();
  fs::create_directories(orphan + "/Library");
  std::ofstream(orphan + "/Library/data") << "left by a killed rgctl";
  std::string notAUuid = containers() + "notes";
  fs::create_directories(notAUuid);
  std::string outside = root() + "/outside";
  fs::create_directories(outside);
  std::ofstream(outside + "/data") << "not a container";
  std::string link = containers() + value::Uuid::random().string();
  fs::create_directory_symlink(outside, link);

  Subprocess::Outcome listed = rgctl({"list"});
  EXPECT_EQ(listed.status, 0) << listed.err;
  EXPECT_NE(listed.err.find("removing the orphan data container " + orphan), std::string::npos)
      << listed.err;
  EXPECT_FALSE(fs::exists(orphan));
  EXPECT_TRUE(fs::is_directory(aContainer));
  EXPECT_TRUE(fs::is_directory(notAUuid));
  EXPECT_TRUE(fs::is_symlink(link));
  EXPECT_TRUE(fs::exists(outside + "/data"));
  EXPECT_EQ(matchIds(), (Ids{"a"}));
}

}  // namespace
