#include <gtest/gtest.h>

#include <thread>
#include <vector>

#include "axd/AXDPlugIn.h"
#include "platform/sandbox/BootKey.h"
#include "platform/sandbox/GrantTable.h"
#include "platform/sandbox/Sandbox.h"
#include "tests/annexa/LogCapture.h"
#include "tests/plugin/DeviceRoot.h"
#include "tests/plugin/RegistryRecords.h"

namespace {

using namespace records;
using registrum::PlugInRecord;

// Plug-ins in a real application on a fresh device root, so their resources can be shared.
class AXDPlugInFormTest : public DeviceRootTest {
 protected:
  void SetUp() override {
    DeviceRootTest::SetUp();
    app_ = canonical(directory("Apps/Host.app"));
    directory("Apps/Host.app/PlugIns/Tool.appex/Resources");
    directory("Apps/Host.app/PlugIns/Tool.bundle/Resources");
  }

  std::shared_ptr<AXDPlugIn> inApp(const std::string& name,
                                   std::optional<value::Value> shared = std::nullopt) {
    PlugInRecord::Fields fields = plugIn(app_ + "/PlugIns/" + name);
    fields.containingApplication = application(app_);
    if (shared) fields.plugInDictionary = fields.plugInDictionary.with("Shared", *shared);
    return build(fields);
  }

  // The path of the grant |token| gives when consumed.
  static std::string grantedPath(const value::Value* token) {
    if (!token || !token->asString()) return "no token";
    os::Result<std::int64_t> handle = sandbox::Sandbox::consume(*token->asString());
    if (!handle.ok()) return handle.error().message;
    std::string path = sandbox::GrantTable::shared().find(handle.value())->path();
    sandbox::Sandbox::release(handle.value());
    return path;
  }

  static std::optional<std::string> key() {
    os::Result<std::string> loaded = sandbox::BootKey::load();
    return loaded.ok() ? std::optional(loaded.value()) : std::nullopt;
  }

  static value::Dictionary extensionsOf(const value::Dictionary& form) {
    const value::Value* extensions = form.find("extensions");
    return extensions && extensions->asDictionary() ? *extensions->asDictionary()
                                                    : value::Dictionary{{"absent", S("")}};
  }

  std::string app_;
};

TEST_F(AXDPlugInFormTest, SharedResourcesAreExtensionsInsideTheBundle) {
  value::Dictionary form{{"identifier", S(kIdentifier)}};
  EXPECT_EQ(inApp("Tool.bundle")->augmentForm(form, key()),
            form);  // nothing shared, no "extensions"

  auto single = inApp("Tool.bundle", S("Resources"));
  ASSERT_TRUE(single);
  value::Dictionary extensions = extensionsOf(single->augmentForm({}, key()));
  ASSERT_EQ(extensions.size(), 1u);
  EXPECT_EQ(grantedPath(extensions.find("Resources")), single->path() + "/Resources");

  auto none = inApp("Tool.bundle", A({}));
  EXPECT_EQ(none->augmentForm({}, key()), (value::Dictionary{{"extensions", D({})}}));
}

TEST_F(AXDPlugInFormTest, AResourceThatCannotBeSharedOrLiesOutsideTheBundleIsLeftOutAndLogged) {
  auto record = inApp("Tool.bundle", A({S("Missing"), value::Value::integer(7), S("../Tool.appex"),
                                        S("Resources/../Resources")}));
  ASSERT_TRUE(record);
  LogCapture log;
  value::Dictionary extensions = extensionsOf(record->augmentForm({}, key()));
  EXPECT_EQ(extensions.size(), 1u);
  EXPECT_EQ(grantedPath(extensions.find("Resources/../Resources")), record->path() + "/Resources");
  EXPECT_NE(
      log.text().find("failed to make extension for " + record->path() + "/Missing in plug-in at " +
                      record->path() + ": No such file or directory"),
      std::string::npos)
      << log.text();
  EXPECT_NE(
      log.text().find("/../Tool.appex in plug-in at " + record->path() + ": Permission denied"),
      std::string::npos)
      << log.text();
}

class AXDPlugInNameTest : public ::testing::Test {
 protected:
  static std::shared_ptr<AXDPlugIn> named(std::optional<std::string> name,
                                          std::optional<std::string> shortName) {
    PlugInRecord::Fields fields = plugIn("/Apps/Host.app/PlugIns/Tool.appex");
    fields.containingApplication = application("/Apps/Host.app");
    fields.localizedName = std::move(name);
    fields.localizedShortName = std::move(shortName);
    return build(fields);
  }
};

// The names are read from the registry at the first call; racing first calls must agree.
TEST_F(AXDPlugInNameTest, ConcurrentFirstReadsAgree) {
  for (int round = 0; round < 20; ++round) {
    auto record = named("Tool", "T");
    ASSERT_TRUE(record);
    std::vector<std::string> seen(8);
    std::vector<std::thread> readers;
    for (std::size_t i = 0; i < seen.size(); ++i) {
      readers.emplace_back([&, i] {
        seen[i] = record->localizedName().value_or("") + "/" +
                  record->localizedShortName().value_or("") + "/" +
                  record->localizedContainingName().value_or("");
      });
    }
    for (std::thread& reader : readers) reader.join();
    for (const std::string& names : seen) EXPECT_EQ(names, "Tool/T/Host");
  }
}

}  // namespace
