#include <gtest/gtest.h>

#include "bench/BulkFrames.h"
#include "bench/MatchFrames.h"
#include "bench/PlugInPopulation.h"
#include "bench/WireClient.h"
#include "tests/support/DaemonProcess.h"

namespace {

using value::Dictionary;
using value::Value;

// Enough plug-ins that the reply takes many reads.
constexpr std::size_t kPlugIns = 300;

TEST(WireClient, ReadsWholeRepliesUntilTheDaemonIsGone) {
  auto daemon = DaemonProcess::start(AXD_EXECUTABLE);
  ASSERT_TRUE(daemon.ok()) << daemon.error().message;
  auto applications = PlugInPopulation::write(daemon.value()->root(), kPlugIns, 100);
  ASSERT_TRUE(PlugInPopulation::install(daemon.value()->root(), applications.value()).ok());
  auto wire = WireClient::connect(daemon.value()->servicePath());
  ASSERT_TRUE(wire.ok()) << wire.error().message;

  const Dictionary every{{"QSExtensionPointIdentifier", Value::string("bench.point")}};
  for (std::uint64_t id : {7, 8}) {
    os::Status answered = wire.value()->roundTrip(MatchFrames::request(every, 0, id));
    ASSERT_TRUE(answered.ok()) << answered.error().message;
    EXPECT_GT(wire.value()->reply().size(), 4 * 64 * 1024u);
    std::optional<zyn::Frame> frame = MatchFrames::decode(wire.value()->reply());
    ASSERT_TRUE(frame.has_value());
    EXPECT_EQ(frame->id, id);
    EXPECT_EQ(MatchFrames::forms(frame->body), kPlugIns);
  }
  ASSERT_TRUE(wire.value()->roundTrip(BulkFrames::request(0, 9)).ok());
  std::span<const std::uint8_t> bulk = wire.value()->reply();
  EXPECT_EQ(std::vector<std::uint8_t>(bulk.begin(), bulk.end()), BulkFrames::reply(9));

  daemon.value().reset();
  EXPECT_FALSE(wire.value()->roundTrip(BulkFrames::request(0, 10)).ok());
}

}  // namespace
