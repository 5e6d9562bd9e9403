#include <gtest/gtest.h>

#include "Annexa/AXPlugInInterface.h"
#include "Annexa/AXUtilities.h"
#include "LogCapture.h"
#include "PlugInFixtures.h"
#include "platform/runtime/Runtime.h"

namespace {

using namespace fixtures;
using runtime::Runtime;

// The form that discovery would send for a plug-in at |path| whose plug-in dictionary, merged
// with its SDK, is |plugIn|: the manifest in "bundleInfo" names no protocol, as when the SDK
// gives it.
value::Dictionary formOf(value::Value plugIn, const char* path = kAppexPath) {
  auto r = record(path, manifest(D({})));
  r->canonicalize();
  return dictionaryChanging(r->exportForm(), "info", std::move(plugIn));
}

class AXPlugInInterfaceMake : public ::testing::Test {
 protected:
  static void SetUpTestSuite() {
    Runtime::shared().addProtocol("ShareProtocol", {}, {"share:progress:"});
  }

  static std::optional<AXError> failure(
      const value::Dictionary& form, const AXPlugInInterface::Configuration& configuration = {}) {
    std::optional<AXError> error;
    EXPECT_EQ(AXPlugInInterface::make(form, configuration, &error), nullptr);
    return error;
  }
};

TEST_F(AXPlugInInterfaceMake, RefusesWhatCannotBeTalkedTo) {
  EXPECT_EQ(failure(value::Dictionary())->code(), 4);

  auto data = failure(formOf(D({{"QSExtensionProtocol", S("#Data")}})));
  EXPECT_EQ(data->code(), 12);
  EXPECT_EQ(data->localizedDescription(), "com.example.tool is a data plug-in: it has no protocol");

  auto none = failure(formOf(D({}), kBundlePath));
  EXPECT_EQ(none->code(), 12);
  EXPECT_EQ(none->localizedDescription(),
            "com.example.tool names no protocol: \"QSExtensionProtocol\" is absent");

  EXPECT_EQ(failure(formOf(D({{"QSExtensionProtocol", I(3)}})))->code(), 12);

  LogCapture log;
  EXPECT_EQ(failure(formOf(D({{"QSExtensionProtocol", S("Unknown")}})))->code(), 12);

  auto badSpecification = failure(formOf(D({{"QSExtensionProtocol", S("ShareProtocol")}})),
                                  {{"share:progress:", "request:0:{String},call:1:{String}"}});
  EXPECT_EQ(badSpecification->code(), 6);
  EXPECT_EQ(badSpecification->localizedDescription(), "call");
}

}  // namespace
