// Registration through the real daemon: add, remove, and the registry's notices of changes that
// another process makes.

#include <chrono>
#include <string>
#include <thread>
#include <vector>

#include "Annexa/AXProtocol.h"
#include "platform/launcher/ServiceLauncher.h"
#include "platform/registrum/Workspace.h"
#include "tests/e2e/Bundles.h"
#include "tests/e2e/DaemonTest.h"
#include "tests/support/BlockingClient.h"

namespace {

using value::Value;

const std::string kManager = AXD_VENDOR_PREFIX ".private.annexa.manager";

class RegistrationTest : public DaemonTest {
 protected:
  void SetUp() override {
    ASSERT_TRUE(start());
    auto opened = registrum::Workspace::open(daemon().root());
    ASSERT_TRUE(opened.ok());
    registry_ = opened.value();
    client_ = std::make_unique<BlockingClient>();
  }

  std::string add(const std::vector<std::string>& paths) {
    return client_->outcome(client_->client().request(AXProtocol::kAdd, paths));
  }
  std::string remove(const std::vector<std::string>& paths) {
    return client_->outcome(client_->client().request(AXProtocol::kRemove, paths));
  }
  bool registered(const std::string& path) {
    auto record = registry_->plugInAtPath(path);
    return record.ok() && record.value();
  }
  std::string bundle(const std::string& app, const std::string& id) {
    return bundles::plugIn(daemon().root() + "/Applications", app, id);
  }

  std::shared_ptr<registrum::Workspace> registry_;
  std::unique_ptr<BlockingClient> client_;
};

TEST_F(RegistrationTest, AddStopsAtTheFirstBadPathAndKeepsWhatCameBefore) {
  std::string good = bundle("Notes", "add.good");
  std::string later = bundle("Notes", "add.later");
  EXPECT_EQ(add({}), "ok");
  EXPECT_EQ(add({good, "Notes.app/PlugIns/x.appex", later}),
            "9: absolute path required: Notes.app/PlugIns/x.appex");
  EXPECT_TRUE(registered(good));
  EXPECT_FALSE(registered(later));

  EXPECT_EQ(add({daemon().root() + "/missing.appex"}),
            "9: invalid plugin path: " + daemon().root() + "/missing.appex");
  std::string empty = daemon().root() + "/Empty.appex";
  std::filesystem::create_directories(empty);
  EXPECT_EQ(add({empty}), "2: unable to register plug-in at " + empty);
  EXPECT_EQ(logCount("failed to register plug-in at " + empty), 1u);

  // A symbolic link is registered as the bundle it resolves to.
  std::string link = daemon().root() + "/link.appex";
  std::filesystem::create_directory_symlink(later, link);
  EXPECT_EQ(add({link}), "ok");
  EXPECT_TRUE(registered(later));
}

TEST_F(RegistrationTest, MalformedPathListsAreRefused) {
  auto request = client_->client().request(AXProtocol::kAdd);
  request[AXProtocol::kPaths] = Value::string("/a/b.appex");
  EXPECT_EQ(client_->outcome(request), "4: invalid request format");
  request[AXProtocol::kPaths] = Value::array({Value::integer(1)});
  EXPECT_EQ(client_->outcome(request), "4: invalid request format");
  request.erase(AXProtocol::kPaths);
  EXPECT_EQ(client_->outcome(request), "4: invalid request format");
}

TEST_F(RegistrationTest, RemoveNeedsTheManagerEntitlement) {
  std::string path = bundle("Notes", "remove.me");
  ASSERT_EQ(add({path}), "ok");
  EXPECT_EQ(remove({"/does/not/exist.appex"}), "11: caller lacks entitlement for this operation");
  EXPECT_TRUE(logHasLineWith({"refused request from pid=" + std::to_string(getpid()),
                              "/does/not/exist.appex - client lacks required entitlement"}));

  bundles::grantThisProgram(daemon().root(), {{kManager, Value::boolean(true)}});
  client_ = std::make_unique<BlockingClient>();  // entitlements are read when a client connects
  EXPECT_EQ(remove({path}), "ok");
  EXPECT_FALSE(registered(path));
  EXPECT_EQ(remove({"/does/not/exist.appex"}), "9: no plugin at /does/not/exist.appex");
}

TEST_F(RegistrationTest, AnUninstallByAnotherProcessIsLoggedAndWithdrawsServices) {
  std::string first = bundle("Widgets", "widget.one");
  std::string second = bundle("Widgets", "widget.two");
  ASSERT_EQ(add({first, second}), "ok");
  ASSERT_TRUE(daemon().waitForLog("INSTALLED:widget.two widget.two(1.0)"));
  ASSERT_TRUE(
      launcher::ServiceLauncher::addService(getpid(), "widget.one", "1.0", "/bin/sh", {}).ok());

  ASSERT_TRUE(registry_->uninstallApplication(daemon().root() + "/Applications/Widgets.app").ok());
  ASSERT_TRUE(daemon().waitForLog("UNINSTALLED:widget.two widget.two(1.0)"));
  EXPECT_TRUE(logHasLineWith({"UNINSTALLED:widget.one widget.one(1.0)", first}));
  // The withdrawal is not awaited by the notice; give the service queue its moment.
  auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(10);
  while (!launcher::ServiceLauncher::services().value().empty() &&
         std::chrono::steady_clock::now() < deadline) {
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
  }
  EXPECT_TRUE(launcher::ServiceLauncher::services().value().empty());
  EXPECT_EQ(logCount("PLUGIN REMOVAL:"), 0u);
}

}  // namespace
