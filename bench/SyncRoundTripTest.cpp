#include <gtest/gtest.h>

#include "bench/PlugInPopulation.h"
#include "bench/SyncRoundTrip.h"
#include "tests/support/DaemonProcess.h"

namespace {

using value::Dictionary;
using value::Value;

TEST(SyncRoundTrip, CountsTheFormsTheDaemonReturnsAndFailsOnceItIsGone) {
  auto daemon = DaemonProcess::start(AXD_EXECUTABLE);
  ASSERT_TRUE(daemon.ok()) << daemon.error().message;
  auto applications = PlugInPopulation::write(daemon.value()->root(), 30, 10);
  ASSERT_TRUE(PlugInPopulation::install(daemon.value()->root(), applications.value()).ok());
  AXDaemonClient client;
  const Dictionary every{{"QSExtensionPointIdentifier", Value::string("bench.point")}};
  EXPECT_EQ(SyncRoundTrip::match(client, every, 0), 30u);
  EXPECT_EQ(SyncRoundTrip::match(client, std::nullopt, 0), 30u);
  const Dictionary one{{"QSExtensionIdentifier", Value::string(PlugInPopulation::identifier(29))}};
  EXPECT_EQ(SyncRoundTrip::match(client, one, 0), 1u);
  const Dictionary none{{"QSExtensionIdentifier", Value::string("bench.none")}};
  EXPECT_EQ(SyncRoundTrip::match(client, none, 0), 0u);
  EXPECT_TRUE(SyncRoundTrip::bulk(client, 0));

  daemon.value().reset();
  EXPECT_FALSE(SyncRoundTrip::bulk(client, 0));
  EXPECT_EQ(SyncRoundTrip::match(client, every, 0), std::nullopt);
}

}  // namespace
