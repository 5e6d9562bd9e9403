#include <gtest/gtest.h>

#include "Annexa/AXPlugInCore.h"
#include "PlugInFixtures.h"

namespace {

using namespace fixtures;
using value::Value;

// One diagnosis case: where the plug-in lies, its plug-in dictionary, and the message expected
// (empty for none).
struct DiagnoseCase {
  const char* path;
  value::Value plugIn;
  std::string message;
};

TEST(AXPlugInCoreDiagnose, EveryCheckInOrder) {
  value::Value attributes = D({{"QSExtensionVersion", S("1")}});
  const std::vector<DiagnoseCase> cases = {
      {kBundlePath, D({{"QSExtensionProtocol", S("P")}, {"QSExtensionAttributes", attributes}}),
       ""},
      {kAppexPath, D({{"QSExtensionAttributes", attributes}}), ""},
      {kBundlePath, D({}), "missing \"QSExtensionProtocol\" key in Info.plist or SDK"},
      {kBundlePath, D({{"QSExtensionProtocol", S("P")}}),
       "missing \"QSExtensionAttributes\" key in Info.plist or SDK"},
      {kAppexPath, D({{"QSExtensionAttributes", attributes}, {"PrincipalClass", S("Main")}}),
       "Application Extensions may not use the \"PrincipalClass\" key"},
      {kBundlePath,
       D({{"QSExtensionProtocol", S("P")},
          {"QSExtensionAttributes", attributes},
          {"PassProxy", B(true)},
          {"EmbeddedCode", B(true)}}),
       "the \"PassProxy\" key is not supported on this platform"},
      {kBundlePath,
       D({{"QSExtensionProtocol", S("P")},
          {"QSExtensionAttributes", attributes},
          {"EmbeddedCode", B(false)}}),
       "hybrid plug-ins are not supported on this platform"},
  };
  for (const DiagnoseCase& c : cases) {
    auto r = record(c.path, manifest(c.plugIn));
    ASSERT_TRUE(r);
    std::optional<AXError> error = r->diagnose();
    SCOPED_TRACE(c.plugIn.description());
    if (c.message.empty()) {
      EXPECT_FALSE(error) << error->description();
      continue;
    }
    ASSERT_TRUE(error);
    EXPECT_EQ(error->domain(), "Annexa");
    EXPECT_EQ(error->code(), 12);
    EXPECT_EQ(error->localizedDescription(), c.message);
  }

  AXPlugInCore anonymous;
  anonymous.setUrl(AXFileURL(kBundlePath));
  EXPECT_EQ(anonymous.diagnose()->localizedDescription(),
            "missing identifier (no QSExtensionIdentifier, nor even QFBundleIdentifier)");
}

}  // namespace
