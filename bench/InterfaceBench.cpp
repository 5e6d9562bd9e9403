// axd_interface_bench: what a host pays to talk to a discovered plug-in over its protocol, each
// cost against the work the host does anyway in the same run: building a plug-in's message
// interface from its form against rebuilding its record from that form; finding a compound
// protocol against finding one protocol; checking a message's arguments against encoding them.

#include <benchmark/benchmark.h>

#include <vector>

#include "Annexa/AXFileURL.h"
#include "Annexa/AXInterfaceBuilder.h"
#include "Annexa/AXPlugInCore.h"
#include "Annexa/AXPlugInInterface.h"
#include "platform/runtime/Runtime.h"
#include "platform/value/CborCodec.h"

namespace {

using value::Value;

const Value kCompound =
    Value::array({Value::string("bench.Sharing"), Value::string("bench.Cancelling")});

const AXPlugInInterface::Configuration kConfiguration = {
    {"share:progress:", "request:0:{Item+String},request:1:bench.Progress,reply:0:{Boolean}"}};

// Registers what the host speaks, once.
bool registerProtocols() {
  AXRootProtocol();
  auto& rt = runtime::Runtime::shared();
  rt.addProtocol("bench.Progress", {}, {"report:"});
  rt.addProtocol("bench.Sharing", {"QSObject"}, {"share:progress:"});
  rt.addProtocol("bench.Cancelling", {}, {"cancel"});
  rt.addClass("Item", [](const Value& v) { return v.asDictionary() != nullptr; });
  return true;
}
const bool kRegistered = registerProtocols();

// The form of a share plug-in as discovery returns it.
value::Dictionary shareForm() {
  value::Dictionary plugIn{{"QSExtensionPointIdentifier", Value::string("bench.point")},
                           {"QSExtensionProtocol", kCompound}};
  Value info = Value::dictionary({{"QFBundleIdentifier", Value::string("bench.share")},
                                  {"QFBundleShortVersionString", Value::string("1.0")},
                                  {"QSExtension", Value::dictionary(plugIn)}});
  auto record =
      AXPlugInCore::initWithName("bench.share", AXFileURL("/Apps/Host.app/PlugIns/Share.appex"),
                                 info, std::nullopt, std::nullopt);
  record->canonicalize();
  return record->exportForm();
}

void RecordFromForm(benchmark::State& state) {
  const value::Dictionary form = shareForm();
  for (auto _ : state) benchmark::DoNotOptimize(AXPlugInCore::initWithForm(form));
}
BENCHMARK(RecordFromForm);

void InterfaceFromForm(benchmark::State& state) {
  const value::Dictionary form = shareForm();
  for (auto _ : state) {
    auto interface = AXPlugInInterface::make(form, kConfiguration);
    if (!interface) state.SkipWithError("no interface");
    benchmark::DoNotOptimize(interface);
  }
}
BENCHMARK(InterfaceFromForm);

void LookUpProtocol(benchmark::State& state) {
  for (auto _ : state) benchmark::DoNotOptimize(AXLookUpProtocol("bench.Sharing"));
}
BENCHMARK(LookUpProtocol);

void CompoundFromSpec(benchmark::State& state) {
  for (auto _ : state) benchmark::DoNotOptimize(AXProtocolFromSpec(kCompound));
}
BENCHMARK(CompoundFromSpec);

std::vector<runtime::Argument> shareArguments() {
  return {Value::dictionary({{"text", Value::string("Buy milk")}}),
          runtime::Argument::proxy(runtime::Runtime::shared().lookUpProtocol("bench.Progress"))};
}

void EncodeArguments(benchmark::State& state) {
  const Value item = *shareArguments()[0].value();
  std::vector<std::uint8_t> bytes;
  for (auto _ : state) {
    bytes.clear();
    value::CborCodec::encode(Value::array({item, Value::string("bench.Progress")}), bytes);
    benchmark::DoNotOptimize(bytes.data());
  }
}
BENCHMARK(EncodeArguments);

void CheckArguments(benchmark::State& state) {
  auto interface = AXPlugInInterface::make(shareForm(), kConfiguration);
  const std::vector<runtime::Argument> arguments = shareArguments();
  for (auto _ : state) {
    benchmark::DoNotOptimize(interface->checkArguments("share:progress:", false, arguments));
  }
}
BENCHMARK(CheckArguments);

}  // namespace

BENCHMARK_MAIN();
