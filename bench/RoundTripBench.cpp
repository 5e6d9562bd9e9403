// axd_bench: the round trip of a bulk request through the client library and the real daemon,
// next to a raw Unix-socket ping-pong of the same bytes between two processes, for one and for
// four concurrent clients; and the daemon's bulk requests for one and for 64 concurrent clients,
// whose aggregate throughputs are compared. scripts/bench runs it and prints the daemon's figures
// as ratios.

#include <benchmark/benchmark.h>

#include <cstdio>
#include <memory>
#include <vector>

#include "Annexa/AXDaemonClient.h"
#include "bench/BulkFrames.h"
#include "bench/EchoServer.h"
#include "bench/SyncRoundTrip.h"
#include "tests/support/DaemonProcess.h"

namespace {

constexpr int kRoundTripClients = 4;
constexpr int kMaxClients = 64;
constexpr std::uint64_t kBulkFlags = 0;
constexpr std::uint64_t kMessageId = 1;

// Both far ends are one process with a thread per client socket; each benchmark thread owns
// one socket or one client, as a host owns its connection.
struct Peers {
  std::unique_ptr<EchoServer> echo;
  std::unique_ptr<DaemonProcess> daemon;
  std::vector<std::unique_ptr<AXDaemonClient>> clients;
};

Peers* gPeers = nullptr;

std::size_t clientIndex(const benchmark::State& state) {
  return static_cast<std::size_t>(state.thread_index());
}

void RawSocketRoundTrip(benchmark::State& state) {
  EchoServer& echo = *gPeers->echo;
  const std::size_t index = clientIndex(state);
  for (auto _ : state) {
    os::Status done = echo.roundTrip(index);
    if (!done.ok()) {
      state.SkipWithError(done.error().message.c_str());
      break;
    }
  }
}

void DaemonBulkRoundTrip(benchmark::State& state) {
  AXDaemonClient& client = *gPeers->clients[clientIndex(state)];
  for (auto _ : state) {
    if (!SyncRoundTrip::bulk(client, kBulkFlags)) {
      state.SkipWithError("the bulk request failed");
      break;
    }
  }
}

BENCHMARK(RawSocketRoundTrip)
    ->Threads(1)
    ->Threads(kRoundTripClients)
    ->UseRealTime()
    ->Unit(benchmark::kMicrosecond);
BENCHMARK(DaemonBulkRoundTrip)
    ->Threads(1)
    ->Threads(kRoundTripClients)
    ->UseRealTime()
    ->Unit(benchmark::kMicrosecond);

// The same requests as DaemonBulkRoundTrip, read as a throughput: many hosts asking at once must
// together get at least as many answers per second as one.
void BulkThroughput(benchmark::State& state) {
  DaemonBulkRoundTrip(state);
}
BENCHMARK(BulkThroughput)
    ->Threads(1)
    ->Threads(kMaxClients)
    ->UseRealTime()
    ->Unit(benchmark::kMicrosecond);

int fail(const char* what, const os::Error& error) {
  std::fprintf(stderr, "axd_bench: %s: %s\n", what, error.message.c_str());
  return 1;
}

}  // namespace

int main(int argc, char** argv) {
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
  // Forked first, while this process still has a single thread.
  auto echo = EchoServer::start(kRoundTripClients, BulkFrames::request(kBulkFlags, kMessageId),
                                BulkFrames::reply(kMessageId));
  if (!echo.ok()) return fail("cannot start the echo process", echo.error());
  auto daemon = DaemonProcess::start(AXD_EXECUTABLE);
  if (!daemon.ok()) return fail("cannot start the daemon", daemon.error());
  // Members go in reverse: the clients say goodbye before the daemon stops.
  Peers peers{std::move(echo).value(), std::move(daemon).value(), {}};
  for (int i = 0; i < kMaxClients; ++i) peers.clients.push_back(std::make_unique<AXDaemonClient>());
  gPeers = &peers;
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  gPeers = nullptr;
  return 0;
}
