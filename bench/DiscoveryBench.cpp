// axd_discovery_bench: discovery (a match request) through the client library and the real daemon
// over 1,000 and 10,000 installed plug-ins, for a rule that every plug-in satisfies and for a rule
// that names one identifier, next to a bulk round trip to the same daemon and to encoding the
// full discovery's reply into a frame with the daemon's own encoder. Every case is measured
// warm: each daemon has answered both rules once before timing starts. scripts/bench runs it and
// prints the figures as ratios.

#include <benchmark/benchmark.h>

#include <cerrno>
#include <chrono>
#include <cstdio>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "Annexa/AXDaemonClient.h"
#include "bench/PlugInPopulation.h"
#include "bench/SyncRoundTrip.h"
#include "platform/zyn/Frame.h"
#include "tests/support/DaemonProcess.h"

namespace {

using value::Dictionary;
using value::Value;

constexpr std::size_t kSizes[] = {1000, 10000};
// Applications of a hundred plug-ins: a registry of many applications, each installed in one
// transaction, which keeps installing 10,000 plug-ins to seconds.
constexpr std::size_t kPlugInsPerApplication = 100;
constexpr std::uint64_t kFlags = 0;

// One daemon on a device root of its own with |plugIns| plug-ins installed, and its client.
struct Installation {
  std::size_t plugIns = 0;
  std::unique_ptr<DaemonProcess> daemon;
  std::unique_ptr<AXDaemonClient> client;
  // The reply to the rule every plug-in satisfies, as the daemon sent it.
  Value everyReply;
};

Dictionary everyPlugIn() {
  return Dictionary{
      {"QSExtensionPointIdentifier", Value::string(PlugInPopulation::kExtensionPoint)}};
}

// The identifier in the middle of the registry's path order.
Dictionary oneIdentifier(std::size_t plugIns) {
  return Dictionary{
      {"QSExtensionIdentifier", Value::string(PlugInPopulation::identifier(plugIns / 2))}};
}

void MatchEveryPlugIn(benchmark::State& state, Installation* installation) {
  const Dictionary rule = everyPlugIn();
  for (auto _ : state) {
    if (SyncRoundTrip::match(*installation->client, rule, kFlags) != installation->plugIns) {
      state.SkipWithError("the match request failed or missed plug-ins");
      break;
    }
  }
}

void MatchOneIdentifier(benchmark::State& state, Installation* installation) {
  const Dictionary rule = oneIdentifier(installation->plugIns);
  for (auto _ : state) {
    if (SyncRoundTrip::match(*installation->client, rule, kFlags) != 1u) {
      state.SkipWithError("the match request failed or returned other plug-ins");
      break;
    }
  }
}

void BulkRoundTrip(benchmark::State& state, Installation* installation) {
  for (auto _ : state) {
    if (!SyncRoundTrip::bulk(*installation->client, kFlags)) {
      state.SkipWithError("the bulk request failed");
      break;
    }
  }
}

// What the daemon must do for a full discovery whatever else it does: encode the reply.
void EncodeReply(benchmark::State& state, Installation* installation) {
  std::vector<std::uint8_t> frame;
  for (auto _ : state) {
    frame.clear();
    zyn::encodeFrame(zyn::Frame{zyn::FrameKind::Reply, 1, installation->everyReply}, frame);
    benchmark::DoNotOptimize(frame.data());
  }
}

// Each case once per installation, named "<case>/<plug-ins>".
void registerCases(std::vector<Installation>& installations) {
  for (Installation& installation : installations) {
    const std::string size = std::to_string(installation.plugIns);
    for (auto [name, run] :
         {std::pair{"MatchEveryPlugIn", &MatchEveryPlugIn},
          std::pair{"MatchOneIdentifier", &MatchOneIdentifier},
          std::pair{"BulkRoundTrip", &BulkRoundTrip}, std::pair{"EncodeReply", &EncodeReply}}) {
      benchmark::RegisterBenchmark((std::string(name) + "/" + size).c_str(), run, &installation)
          ->UseRealTime()
          ->Unit(benchmark::kMicrosecond);
    }
  }
}

double secondsSince(std::chrono::steady_clock::time_point start) {
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

// Writes and registers the plug-ins of |installation| on its daemon's root, then asks the daemon
// for both rules once, untimed: that fills its plug-in cache and checks what it returns.
os::Status populate(Installation& installation) {
  const std::string& root = installation.daemon->root();
  auto start = std::chrono::steady_clock::now();
  auto applications = PlugInPopulation::write(root, installation.plugIns, kPlugInsPerApplication);
  if (!applications.ok()) return applications.error();
  const double written = secondsSince(start);
  start = std::chrono::steady_clock::now();
  os::Status installed = PlugInPopulation::install(root, applications.value());
  if (!installed.ok()) return installed;
  std::fprintf(stderr,
               "%zu plug-ins in %zu applications: bundles written in %.1f s, "
               "registered in %.1f s\n",
               installation.plugIns, applications.value().size(), written, secondsSince(start));
  AXDaemonClient& client = *installation.client;
  std::optional<Value> reply = SyncRoundTrip::matchReply(client, everyPlugIn(), kFlags);
  if (!reply) return os::Error{EPROTO, "the daemon refuses the discovery"};
  installation.everyReply = *reply;
  if (SyncRoundTrip::match(client, everyPlugIn(), kFlags) != installation.plugIns ||
      SyncRoundTrip::match(client, oneIdentifier(installation.plugIns), kFlags) != 1u) {
    return os::Error{EPROTO, "the daemon does not return the installed plug-ins"};
  }
  return os::success();
}

int fail(const char* what, const os::Error& error) {
  std::fprintf(stderr, "axd_discovery_bench: %s: %s\n", what, error.message.c_str());
  return 1;
}

}  // namespace

int main(int argc, char** argv) {
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
  std::vector<Installation> installations;
  for (std::size_t size : kSizes) {
    // A client connects to the daemon of the root in force when it is made. The clients made
    // before are idle while the next daemon changes that root.
    auto daemon = DaemonProcess::start(AXD_EXECUTABLE);
    if (!daemon.ok()) return fail("cannot start the daemon", daemon.error());
    installations.push_back({size, std::move(daemon).value(), std::make_unique<AXDaemonClient>()});
    os::Status populated = populate(installations.back());
    if (!populated.ok()) return fail("cannot install the plug-ins", populated.error());
  }
  registerCases(installations);
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  // Last made, first stopped: each daemon puts back the root that was in force before it.
  while (!installations.empty()) installations.pop_back();
  return 0;
}
