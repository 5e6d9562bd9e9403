#include <gtest/gtest.h>

#include "Annexa/AXDaemonClient.h"
#include "bench/BulkFrames.h"
#include "bench/RawService.h"
#include "tests/platform/ScopedEnvironment.h"
#include "tests/platform/TempDirectory.h"

namespace {

TEST(BulkFrames, RequestIsWhatTheClientLibrarySends) {
  TempDirectory root;
  ScopedEnvironment environment;
  environment.set("ANNEXA_ROOT", root.path());
  RawService service("bench.raw");
  std::vector<std::uint8_t> sent;
  {
    AXDaemonClient client("bench.raw");
    client.bulkPlugins(5, [](const zyn::ReplyOrError&) {});
    sent = service.firstFrame();
  }
  ASSERT_GE(sent.size(), 13u);
  EXPECT_EQ(sent, BulkFrames::request(5, RawService::idOf(sent)));
  EXPECT_NE(sent, BulkFrames::request(6, RawService::idOf(sent)));
}

}  // namespace
