#include <gtest/gtest.h>

#include "axd/AXDPlugIn.h"
#include "tests/annexa/LogCapture.h"
#include "tests/platform/ScopedEnvironment.h"
#include "tests/plugin/RegistryRecords.h"

namespace {

using namespace records;
using registrum::PlugInRecord;

constexpr const char* kSystemPath = "/System/Library/Tool.appex";

class AXDPlugInTest : public ::testing::Test {
 protected:
  void SetUp() override { environment_.unset("ANNEXA_ROOT"); }

  // What initWithRGData logged for |fields| when it refused them; "" when it made a record.
  static std::string refusal(PlugInRecord::Fields fields) {
    LogCapture log;
    return build(std::move(fields)) ? "" : log.text();
  }

  static std::string ignoring(const std::string& path, const std::string& message) {
    return "ignoring mis-configured plug-in at " + path + ": Error Domain=Annexa Code=12 \"" +
           message + "\"";
  }

  ScopedEnvironment environment_;
};

TEST_F(AXDPlugInTest, NoBundleLocationOrIdentifierGivesNoRecord) {
  PlugInRecord::Fields noPath = plugIn(kSystemPath);
  noPath.bundlePath.reset();
  EXPECT_EQ(refusal(noPath), "");
  EXPECT_FALSE(build(noPath));
  EXPECT_FALSE(AXDPlugIn::initWithRGData(nullptr));

  PlugInRecord::Fields noIdentifier = plugIn(kSystemPath);
  noIdentifier.plugInIdentifier.reset();
  EXPECT_NE(
      refusal(noIdentifier).find(std::string("missing identifier in plug-in at ") + kSystemPath),
      std::string::npos);
}

TEST_F(AXDPlugInTest, OutsideApplicationsOnlyTheSystemVolumeUnderTheRootServes) {
  EXPECT_EQ(refusal(plugIn(kSystemPath)), "");
  const std::string outside = "plug-ins outside containing apps must be in /System";
  for (const char* path : {"/var/Tool.appex", "/SystemTool.appex", "/Apps/System/Tool.appex"}) {
    EXPECT_NE(refusal(plugIn(path)).find(ignoring(path, outside)), std::string::npos) << path;
  }
  PlugInRecord::Fields contained = plugIn("/var/Host.app/PlugIns/Tool.appex");
  contained.containingApplication = application("/var/Host.app");
  auto record = build(contained);
  ASSERT_TRUE(record);
  EXPECT_EQ(record->containingPath(), "/var/Host.app");

  environment_.set("ANNEXA_ROOT", "/device/");
  EXPECT_TRUE(build(plugIn("/device/System/Library/Tool.appex")));
  EXPECT_FALSE(build(plugIn(kSystemPath)));
}

// The checks run in order: the base checks, the data container (which only data plug-ins may
// lack), the location.
TEST_F(AXDPlugInTest, OnlyDataPlugInsMayLackADataContainer) {
  PlugInRecord::Fields data = plugIn(kSystemPath);
  data.dataContainerPath.reset();
  data.plugInDictionary = data.plugInDictionary.with("QSExtensionProtocol", S("#Data"));
  EXPECT_EQ(refusal(data), "");

  const std::string outside = "/var/Tool.appex";
  PlugInRecord::Fields code = plugIn(outside);
  code.dataContainerPath.reset();
  EXPECT_NE(refusal(code).find(ignoring(outside, "this plug-in has no sandbox data container")),
            std::string::npos);
  code.plugInDictionary = code.plugInDictionary.with("PassProxy", value::Value::boolean(true));
  EXPECT_NE(refusal(code).find(
                ignoring(outside, "the \"PassProxy\" key is not supported on this platform")),
            std::string::npos);
}

}  // namespace
