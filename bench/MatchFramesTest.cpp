#include <gtest/gtest.h>

#include "Annexa/AXDaemonClient.h"
#include "bench/MatchFrames.h"
#include "bench/RawService.h"
#include "tests/platform/ScopedEnvironment.h"
#include "tests/platform/TempDirectory.h"

namespace {

using value::Dictionary;
using value::Value;

TEST(MatchFrames, RequestIsWhatTheClientLibrarySends) {
  TempDirectory root;
  ScopedEnvironment environment;
  environment.set("ANNEXA_ROOT", root.path());
  RawService service("bench.raw");
  const Dictionary rule{{"QSExtensionPointIdentifier", Value::string("bench.point")}};
  std::vector<std::uint8_t> sent;
  {
    AXDaemonClient client("bench.raw");
    client.matchPlugIns(rule, 0, [](const zyn::ReplyOrError&) {});
    sent = service.firstFrame();
  }
  ASSERT_GE(sent.size(), 13u);
  EXPECT_EQ(sent, MatchFrames::request(rule, 0, RawService::idOf(sent)));
  EXPECT_NE(sent, MatchFrames::request(std::nullopt, 0, RawService::idOf(sent)));
}

}  // namespace
