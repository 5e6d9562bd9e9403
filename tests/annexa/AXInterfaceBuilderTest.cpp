#include <gtest/gtest.h>

#include <latch>
#include <thread>
#include <vector>

#include "Annexa/AXInterfaceBuilder.h"
#include "LogCapture.h"
#include "PlugInFixtures.h"
#include "platform/runtime/Runtime.h"

namespace {

using fixtures::A;
using fixtures::I;
using fixtures::S;
using runtime::MessageInterface;
using runtime::Runtime;

// Protocols and classes live in the process's runtime, so every test uses names of its own.
class AXInterfaceBuilder : public ::testing::Test {
 protected:
  static void SetUpTestSuite() {
    Runtime& rt = Runtime::shared();
    rt.addClass("ClassA", [](const value::Value& v) { return v.asString() != nullptr; });
    rt.addClass("ClassB", [](const value::Value& v) { return v.isNumber(); });
    rt.addProtocol("ToolProtocol", {}, {"perform:"});
    rt.addProtocol("HostProtocol", {}, {"call:"});
  }

  std::optional<AXError> configure(const std::string& specification) {
    return AXConfigureInterface(interface, "call:", specification);
  }

  MessageInterface interface { Runtime::shared().lookUpProtocol("HostProtocol") };
};

void expectMalformed(const std::optional<AXError>& error, const std::string& message) {
  ASSERT_TRUE(error);
  EXPECT_EQ(error->domain(), "Annexa");
  EXPECT_EQ(error->code(), 6);
  EXPECT_EQ(error->localizedDescription(), message);
}

TEST_F(AXInterfaceBuilder, MalformedSpecificationsNameTheOffendingPart) {
  expectMalformed(configure(""), "");
  expectMalformed(configure("call:0:{ClassA}"), "call");
  expectMalformed(configure("request:0:{ClassA"), "{ClassA");
  expectMalformed(configure("request:0:{"), "{");
  expectMalformed(configure("request:0:{}"), "");
  // The parts are counted before the kind is read.
  expectMalformed(configure("call:0"), "call:0");
  // The whole specification is the message, not the entry, when the parts do not count three.
  expectMalformed(configure("request:0:{ClassA},reply:1"), "request:0:{ClassA},reply:1");

  // An empty third part names nothing: refused before any lookup, so nothing is logged.
  LogCapture log;
  expectMalformed(configure("request:0:"), "");
  EXPECT_EQ(log.text(), "");
}

TEST_F(AXInterfaceBuilder, AFailureStopsAtItsEntryAndKeepsTheEarlierOnes) {
  expectMalformed(configure("reply:3:{ClassB},request:0:{ClassA+NoSuchClass},reply:0:{ClassA}"),
                  "NoSuchClass");
  EXPECT_NE(interface.classes("call:", 3, true), nullptr);
  EXPECT_EQ(interface.classes("call:", 0, false), nullptr);
  EXPECT_EQ(interface.classes("call:", 0, true), nullptr);

  LogCapture log;
  expectMalformed(configure("request:4:NoSuchProtocol"), "NoSuchProtocol");
  EXPECT_EQ(interface.interface("call:", 4, false), nullptr);
  const std::string text = log.text();
  const std::string line = "unable to locate protocol \"NoSuchProtocol\"";
  EXPECT_NE(text.find(line), std::string::npos);
  EXPECT_EQ(text.find(line), text.rfind(line));  // logged once
}

TEST_F(AXInterfaceBuilder, AHalfMadeCompoundIsMadeAgainUnderTheSameName) {
  // The missing protocol is registered half-way, so each run of this test needs a name of its own.
  static int run = 0;
  const std::string later = "HalfLater" + std::to_string(++run);
  Runtime::shared().addProtocol("HalfA", {}, {});
  const std::string name = "__XX_COMPOUND__HalfA__" + later;
  {
    LogCapture log;
    std::optional<AXError> error;
    EXPECT_EQ(AXProtocolFromSpec(A({S("HalfA"), S(later)}), &error), nullptr);
    ASSERT_TRUE(error);
    EXPECT_EQ(error->code(), 12);
    EXPECT_NE(error->localizedDescription()->find("\"" + later + "\""), std::string::npos);
    std::string text = log.text();
    EXPECT_EQ(text.find("unable to locate"), text.rfind("unable to locate"));  // logged once
    EXPECT_EQ(Runtime::shared().lookUpProtocol(name), nullptr);
  }
  Runtime::shared().addProtocol(later, {}, {});
  std::optional<AXError> error;
  auto compound = AXProtocolFromSpec(A({S("HalfA"), S(later)}), &error);
  ASSERT_TRUE(compound);
  EXPECT_FALSE(error);
  EXPECT_EQ(compound->name(), name);
  EXPECT_EQ(compound->adoptedProtocols().size(), 2u);
}

TEST_F(AXInterfaceBuilder, ThreadsBuildingOneCompoundAtOnceGetOneProtocol) {
  constexpr int kThreads = 8;
  constexpr int kRounds = 50;
  Runtime::shared().addProtocol("RaceBase", {}, {});
  for (int round = 0; round < kRounds; ++round) {
    Runtime::shared().addProtocol("Race" + std::to_string(round), {}, {});
  }
  std::vector<std::vector<std::shared_ptr<const runtime::Protocol>>> got(
      kThreads, std::vector<std::shared_ptr<const runtime::Protocol>>(kRounds));
  std::latch start(kThreads);
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&, t] {
      start.arrive_and_wait();
      for (int round = 0; round < kRounds; ++round) {
        got[t][round] = AXProtocolFromSpec(A({S("RaceBase"), S("Race" + std::to_string(round))}));
      }
    });
  }
  for (auto& thread : threads) thread.join();
  for (int round = 0; round < kRounds; ++round) {
    auto registered =
        Runtime::shared().lookUpProtocol("__XX_COMPOUND__RaceBase__Race" + std::to_string(round));
    ASSERT_TRUE(registered);
    for (int t = 0; t < kThreads; ++t) EXPECT_EQ(got[t][round], registered);
  }
}

}  // namespace
