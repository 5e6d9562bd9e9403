// axd_discovery_bench: discovery (a match request) through the real daemon over 1,000 and 10,000
// installed plug-ins. A rule that every plug-in satisfies is measured three ways: as the host sees
// it through the client library, over a bare wire connection that reads the reply without
// decoding it (the daemon's cost), and as the client library's decoding of that reply alone. Next
// to them: a rule that names one identifier, a bulk round trip to the same daemon, encoding the
// full reply with the daemon's own encoder, the first full discovery after a start, and bulk
// requests while another client discovers every plug-in. Every case but the first discovery is
// measured warm: each daemon has answered both rules once before timing starts. Before the
// cases run, the daemon's resident memory is read without plug-ins and with them, warm, and put
// in the report's context. scripts/bench runs it and prints the figures as ratios.

#include <benchmark/benchmark.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "Annexa/AXDaemonClient.h"
#include "bench/MatchFrames.h"
#include "bench/PlugInPopulation.h"
#include "bench/ResidentMemory.h"
#include "bench/SyncRoundTrip.h"
#include "bench/WireClient.h"
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
constexpr std::uint64_t kMessageId = 1;
// Each first discovery needs a restart of the daemon, which takes long: a few are enough.
constexpr benchmark::IterationCount kFirstDiscoveries = 2;

// One daemon on a device root of its own with |plugIns| plug-ins installed, and its clients.
struct Installation {
  std::size_t plugIns = 0;
  std::unique_ptr<DaemonProcess> daemon;
  // Fixed when the daemon starts: the path follows the root in force, which the next
  // installation changes.
  std::string servicePath;
  std::unique_ptr<AXDaemonClient> client;
  std::unique_ptr<WireClient> wire;
  // The reply to the rule every plug-in satisfies, as the daemon sent it, and its item.
  std::vector<std::uint8_t> everyReplyFrame;
  Value everyReply;
};

using Case = void (*)(benchmark::State&, Installation*);

Dictionary everyPlugIn() {
  return Dictionary{
      {"QSExtensionPointIdentifier", Value::string(PlugInPopulation::kExtensionPoint)}};
}

std::vector<std::uint8_t> everyPlugInRequest() {
  return MatchFrames::request(everyPlugIn(), kFlags, kMessageId);
}

// The identifier in the middle of the registry's path order.
Dictionary oneIdentifier(std::size_t plugIns) {
  return Dictionary{
      {"QSExtensionIdentifier", Value::string(PlugInPopulation::identifier(plugIns / 2))}};
}

double secondsSince(std::chrono::steady_clock::time_point start) {
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

// The item of |reply| when that is a reply frame with exactly |plugIns| forms.
std::optional<Value> withForms(std::span<const std::uint8_t> reply, std::size_t plugIns) {
  std::optional<zyn::Frame> frame = MatchFrames::decode(reply);
  if (!frame || MatchFrames::forms(frame->body) != plugIns) return std::nullopt;
  return frame->body;
}

os::Error missingPlugIns() {
  return os::Error{EPROTO, "the daemon does not return the installed plug-ins"};
}

// Connects the installation's clients to its daemon; the client library's connects to the root
// in force.
os::Status connect(Installation& installation) {
  installation.client = std::make_unique<AXDaemonClient>();
  auto wire = WireClient::connect(installation.servicePath);
  if (!wire.ok()) return wire.error();
  installation.wire = std::move(wire).value();
  return os::success();
}

// Asks the daemon for both rules once, untimed, as the cases will: that fills its plug-in cache
// and checks what it returns. Keeps the full discovery's reply.
os::Status warm(Installation& installation) {
  os::Status answered = installation.wire->roundTrip(everyPlugInRequest());
  if (!answered.ok()) return answered;
  std::span<const std::uint8_t> reply = installation.wire->reply();
  std::optional<Value> body = withForms(reply, installation.plugIns);
  if (!body) return missingPlugIns();
  installation.everyReplyFrame.assign(reply.begin(), reply.end());
  installation.everyReply = *body;
  AXDaemonClient& client = *installation.client;
  if (SyncRoundTrip::match(client, everyPlugIn(), kFlags) != installation.plugIns ||
      SyncRoundTrip::match(client, oneIdentifier(installation.plugIns), kFlags) != 1u) {
    return missingPlugIns();
  }
  return os::success();
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

void MatchEveryPlugInWire(benchmark::State& state, Installation* installation) {
  const std::vector<std::uint8_t> request = everyPlugInRequest();
  if (!installation->wire) {
    state.SkipWithError("no wire connection to the daemon");
    return;
  }
  for (auto _ : state) {
    os::Status answered = installation->wire->roundTrip(request);
    if (!answered.ok()) {
      state.SkipWithError(answered.error().message.c_str());
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
    zyn::encodeFrame(zyn::Frame{zyn::FrameKind::Reply, kMessageId, installation->everyReply},
                     frame);
    benchmark::DoNotOptimize(frame.data());
  }
}

// What the client library pays for a full discovery's reply once it is read: the bytes go into
// a connection's decoder (a read puts them there), which decodes the frame, and the values are
// freed again.
void DecodeReply(benchmark::State& state, Installation* installation) {
  const std::vector<std::uint8_t>& bytes = installation->everyReplyFrame;
  zyn::FrameDecoder decoder;
  for (auto _ : state) {
    std::memcpy(decoder.prepare(bytes.size()), bytes.data(), bytes.size());
    decoder.commit(bytes.size());
    auto frame = decoder.next();
    if (!frame.ok() || !frame.value()) {
      state.SkipWithError("the reply does not decode");
      break;
    }
    benchmark::DoNotOptimize(frame.value()->body);
  }
}

// Restarts the daemon, untimed, then times a new wire connection's first full discovery.
os::Status timeFirstDiscovery(benchmark::State& state, Installation& installation,
                              std::span<const std::uint8_t> request) {
  os::Status restarted = installation.daemon->restart(AXD_EXECUTABLE);
  if (!restarted.ok()) return restarted;
  const auto start = std::chrono::steady_clock::now();
  auto wire = WireClient::connect(installation.servicePath);
  os::Status answered = wire.ok() ? wire.value()->roundTrip(request) : wire.error();
  state.SetIterationTime(secondsSince(start));
  if (!answered.ok()) return answered;
  if (!withForms(wire.value()->reply(), installation.plugIns)) return missingPlugIns();
  return os::success();
}

// The first full discovery after a start, over the wire. The installation's clients go first,
// and afterwards connect to the last daemon and warm it for the other cases.
void FirstMatchEveryPlugIn(benchmark::State& state, Installation* installation) {
  const std::vector<std::uint8_t> request = everyPlugInRequest();
  // Gone before their daemon: the client library's says goodbye.
  installation->client.reset();
  installation->wire.reset();
  for (auto _ : state) {
    os::Status timed = timeFirstDiscovery(state, *installation, request);
    if (!timed.ok()) {
      state.SkipWithError(timed.error().message.c_str());
      break;
    }
  }
  os::Status connected = connect(*installation);
  os::Status warmed = connected.ok() ? warm(*installation) : connected;
  if (!warmed.ok() && !state.error_occurred()) state.SkipWithError(warmed.error().message.c_str());
}

// Bulk requests of one client while another discovers every plug-in again and again on a wire
// connection of its own; timing starts once the first of those discoveries is answered. The
// counter "slowest_us" is the longest bulk round trip of the run.
void BulkUnderDiscovery(benchmark::State& state, Installation* installation) {
  auto loader = WireClient::connect(installation->servicePath);
  if (!loader.ok()) {
    state.SkipWithError(loader.error().message.c_str());
    return;
  }
  const std::vector<std::uint8_t> request = everyPlugInRequest();
  std::atomic<bool> stop = false;
  std::atomic<bool> failed = false;
  std::atomic<std::size_t> discoveries = 0;
  std::thread background([&] {
    while (!stop.load()) {
      if (!loader.value()->roundTrip(request).ok()) {
        failed.store(true);
        return;
      }
      discoveries.fetch_add(1);
    }
  });
  while (discoveries.load() == 0 && !failed.load()) {
    std::this_thread::sleep_for(std::chrono::milliseconds(1));
  }
  double slowest = 0;
  for (auto _ : state) {
    const auto start = std::chrono::steady_clock::now();
    if (!SyncRoundTrip::bulk(*installation->client, kFlags)) {
      state.SkipWithError("the bulk request failed");
      break;
    }
    slowest = std::max(slowest, secondsSince(start));
  }
  stop.store(true);
  background.join();
  if (failed.load() && !state.error_occurred()) {
    state.SkipWithError("the background discoveries failed");
  }
  state.counters["slowest_us"] = slowest * 1e6;
}

benchmark::internal::Benchmark* registerCase(const char* name, Case run,
                                             Installation* installation) {
  const std::string size = std::to_string(installation->plugIns);
  return benchmark::RegisterBenchmark((std::string(name) + "/" + size).c_str(), run, installation)
      ->Unit(benchmark::kMicrosecond);
}

// Each case once per installation, named "<case>/<plug-ins>"; the first discovery only for the
// largest and the load of discoveries only for the smallest.
void registerCases(std::vector<Installation>& installations) {
  for (Installation& installation : installations) {
    for (auto [name, run] :
         {std::pair{"MatchEveryPlugIn", &MatchEveryPlugIn},
          std::pair{"MatchEveryPlugInWire", &MatchEveryPlugInWire},
          std::pair{"MatchOneIdentifier", &MatchOneIdentifier},
          std::pair{"BulkRoundTrip", &BulkRoundTrip}, std::pair{"EncodeReply", &EncodeReply},
          std::pair{"DecodeReply", &DecodeReply}}) {
      registerCase(name, run, &installation)->UseRealTime();
    }
  }
  // A restart starts the daemon on the root in force, which is the last installation's.
  registerCase("FirstMatchEveryPlugIn", &FirstMatchEveryPlugIn, &installations.back())
      ->UseManualTime()
      ->Iterations(kFirstDiscoveries);
  registerCase("BulkUnderDiscovery", &BulkUnderDiscovery, &installations.front())->UseRealTime();
}

// Puts the daemon's resident memory before and after the warm-up into the report's context as
// "<before> <after>" in KiB, under "resident_kib/<plug-ins>" and "anonymous_kib/<plug-ins>".
void recordMemory(std::size_t plugIns, const ResidentMemory& before, const ResidentMemory& after) {
  const std::string size = std::to_string(plugIns);
  benchmark::AddCustomContext("resident_kib/" + size, std::to_string(before.kibibytes()) + " " +
                                                          std::to_string(after.kibibytes()));
  benchmark::AddCustomContext("anonymous_kib/" + size,
                              std::to_string(before.anonymousKibibytes()) + " " +
                                  std::to_string(after.anonymousKibibytes()));
}

// Writes and registers the plug-ins of |installation| on its daemon's root.
os::Status install(Installation& installation) {
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
  return os::success();
}

// Reads the memory of the daemon on its root without plug-ins after one bulk request, installs
// the plug-ins, restarts the daemon (it builds every record before it listens), warms it and
// reads its memory again: the difference is what the records cost.
os::Status prepare(Installation& installation) {
  os::Status connected = connect(installation);
  if (!connected.ok()) return connected;
  if (!SyncRoundTrip::bulk(*installation.client, kFlags)) {
    return os::Error{EPROTO, "the daemon refuses a bulk request"};
  }
  auto before = ResidentMemory::of(installation.daemon->pid());
  if (!before.ok()) return before.error();
  os::Status installed = install(installation);
  if (!installed.ok()) return installed;
  os::Status restarted = installation.daemon->restart(AXD_EXECUTABLE);
  if (!restarted.ok()) return restarted;
  connected = connect(installation);
  if (!connected.ok()) return connected;
  os::Status warmed = warm(installation);
  if (!warmed.ok()) return warmed;
  auto after = ResidentMemory::of(installation.daemon->pid());
  if (!after.ok()) return after.error();
  recordMemory(installation.plugIns, before.value(), after.value());
  return os::success();
}

// Says how large the full discovery's reply is. EncodeReply stands for the daemon's encoding only
// while it makes the bytes the daemon sent; a note says when it does not.
void describeReply(const Installation& installation) {
  std::fprintf(stderr, "%zu plug-ins: a full discovery's reply frame is %.2f MB\n",
               installation.plugIns, installation.everyReplyFrame.size() / 1e6);
  std::vector<std::uint8_t> again;
  zyn::encodeFrame(zyn::Frame{zyn::FrameKind::Reply, kMessageId, installation.everyReply}, again);
  if (again == installation.everyReplyFrame) return;
  std::fprintf(stderr,
               "note: the daemon's reply for %zu plug-ins (%zu bytes) is not what its encoder "
               "makes of it (%zu bytes)\n",
               installation.plugIns, installation.everyReplyFrame.size(), again.size());
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
    // The clients made before are idle while the next daemon changes the root in force.
    auto daemon = DaemonProcess::start(AXD_EXECUTABLE);
    if (!daemon.ok()) return fail("cannot start the daemon", daemon.error());
    const std::string path = daemon.value()->servicePath();
    installations.push_back({size, std::move(daemon).value(), path});
    os::Status prepared = prepare(installations.back());
    if (!prepared.ok()) return fail("cannot prepare the daemon", prepared.error());
    describeReply(installations.back());
  }
  registerCases(installations);
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  // A daemon that died mid-run fails every later case with a request error; say which it was.
  for (Installation& installation : installations) {
    if (installation.daemon->running()) continue;
    std::fprintf(stderr, "axd_discovery_bench: the daemon of %zu plug-ins exited during the run\n",
                 installation.plugIns);
  }
  // Last made, first stopped: each daemon puts back the root that was in force before it.
  while (!installations.empty()) installations.pop_back();
  return 0;
}
