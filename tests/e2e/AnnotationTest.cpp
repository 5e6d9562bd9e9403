// Elections through the real daemon: the annotate request, the annotation file across restarts
// and crashes, and the change notification that axctl watch follows.

#include <signal.h>

#include <future>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "Annexa/AXProtocol.h"
#include "platform/registrum/Workspace.h"
#include "platform/value/PropertyList.h"
#include "tests/e2e/Bundles.h"
#include "tests/e2e/DaemonTest.h"
#include "tests/platform/TempDirectory.h"
#include "tests/support/BlockingClient.h"

namespace {

using value::Dictionary;
using value::Value;

const std::string kAnnotationChange = AXD_VENDOR_PREFIX ".annexa.annotation-change";

class AnnotationTest : public DaemonTest {
 protected:
  // Starts the daemon on a fresh root with the annotation file of this test.
  void startWithFile() { ASSERT_TRUE(start({"-d", file_})); }

  // Registers plug-in |id| through the daemon and returns its UUID.
  value::Uuid install(const std::string& id) {
    std::string path = bundles::plugIn(daemon().root() + "/Applications", "Notes", id);
    BlockingClient client;
    EXPECT_EQ(client.outcome(client.client().request(AXProtocol::kAdd, {path})), "ok");
    auto registry = registrum::Workspace::open(daemon().root());
    return registry.value()->plugInAtPath(path).value()->uuid();
  }
  static AXDaemonClient::Request annotate(BlockingClient& client,
                                          const std::vector<value::Uuid>& uuids,
                                          const Dictionary& annotations) {
    auto request = client.client().request(AXProtocol::kAnnotate, uuids, 0);
    request[AXProtocol::kAnnotations] = Value::dictionary(annotations);
    return request;
  }
  // The annotation table in the file; nothing when the file is not a version-16 annotation file.
  std::optional<Dictionary> table() const {
    auto plist = value::PropertyList::readFile(file_);
    if (!plist.ok() || !plist.value().asDictionary()) return std::nullopt;
    const Dictionary& top = *plist.value().asDictionary();
    const Value* version = top.find("version");
    const Value* data = top.find("data");
    if (!version || version->integerValue() != 16 || !data || !data->asDictionary()) {
      return std::nullopt;
    }
    return *data->asDictionary();
  }

  TempDirectory home_;
  std::string file_ = home_ / "Annotations";
};

TEST_F(AnnotationTest, AnnotateChecksEveryFieldBeforeStoringAnything) {
  startWithFile();
  value::Uuid first = install("annotate.first");
  value::Uuid second = install("annotate.second");
  BlockingClient client;
  EXPECT_EQ(client.outcome(annotate(client, {first}, {{"election", Value::string("1")}})),
            "4: invalid request format (annotation election)");
  EXPECT_EQ(
      client.outcome(annotate(client, {first},
                              {{"election", Value::integer(1)}, {"extension", Value::array({})}})),
      "4: invalid request format (annotation extension)");
  // Values the wire carries but the file cannot hold are refused like wrong types.
  EXPECT_EQ(
      client.outcome(annotate(client, {first}, {{"election", Value::unsignedInteger(UINT64_MAX)}})),
      "4: invalid request format (annotation election)");
  EXPECT_EQ(client.outcome(annotate(
                client, {first},
                {{"extension", Value::dictionary({{"id", Value::uuid(value::Uuid::random())}})}})),
            "4: invalid request format (annotation extension)");
  EXPECT_EQ(client.outcome(annotate(client, {}, {{"other", Value::integer(1)}})), "ok");
  EXPECT_FALSE(table());  // nothing stored, so nothing written

  value::Uuid unknown = value::Uuid::random();
  EXPECT_EQ(client.outcome(annotate(client, {first, unknown}, {{"election", Value::integer(2)}})),
            "4: no such plugin (uuid not found)");
  EXPECT_EQ(client.outcome(annotate(client, {second}, {{"extension", Value::dictionary({})}})),
            "ok");
  Dictionary stored = table().value();
  EXPECT_EQ(Value::dictionary(stored),
            Value::dictionary({
                {"annotate.first", Value::dictionary({{"election", Value::integer(2)}})},
                {"annotate.second", Value::dictionary({{"extension", Value::dictionary({})}})},
            }));
  EXPECT_TRUE(logHasLineWith({"plug-in annotate.second election := (null)"}));
}

TEST_F(AnnotationTest, TheFileOutlivesTheDaemonAndABadFileIsReplaced) {
  bundles::writePlist(
      file_, Value::dictionary({{"version", Value::integer(15)}, {"data", Value::dictionary({})}}));
  startWithFile();
  EXPECT_TRUE(logHasLineWith({"unable to load annotation database:" + file_,
                              "found database version 15 needed version 16", "(resetting)"}));
  BlockingClient before;
  EXPECT_EQ(before.outcome(annotate(before, {install("kept")}, {{"election", Value::integer(3)}})),
            "ok");

  startWithFile();  // a new daemon on a new device root, with the same annotation file
  EXPECT_EQ(logCount("unable to load annotation database"), 0u);
  BlockingClient after;
  EXPECT_EQ(after.outcome(annotate(after, {install("added")}, {{"election", Value::integer(1)}})),
            "ok");
  Dictionary stored = table().value();
  EXPECT_EQ(stored.size(), 2u);
  EXPECT_EQ(*stored.find("kept"), Value::dictionary({{"election", Value::integer(3)}}));
}

TEST_F(AnnotationTest, KillingTheDaemonMidRewriteNeverLeavesABrokenFile) {
  std::mt19937 random(42);
  for (int round = 0; round < 8; ++round) {
    SCOPED_TRACE(round);
    startWithFile();
    value::Uuid uuid = install("crash.round" + std::to_string(round));
    auto writer = std::async(std::launch::async, [&] {
      BlockingClient client;
      Dictionary extension;
      for (int i = 0; i < 2000; ++i) {
        extension = extension.with("key" + std::to_string(i), Value::string(std::string(64, 'x')));
        auto request = annotate(client, {uuid}, {{"extension", Value::dictionary(extension)}});
        if (client.outcome(request) != "ok") return;
      }
    });
    std::this_thread::sleep_for(std::chrono::milliseconds(random() % 40));
    kill(daemon().pid(), SIGKILL);
    writer.wait();
    EXPECT_TRUE(table()) << "round " << round << " left a file that does not load";
  }
}

TEST_F(AnnotationTest, WatchSeesTheChanges) {
  startWithFile();
  value::Uuid uuid = install("watched");
  auto watch = std::async(std::launch::async, [&] {
    return axctl({"watch", kAnnotationChange, "--count", "3"});
  });
  BlockingClient client;
  // The watcher reports only changes after it started, so change until it has seen three.
  for (int i = 0;
       i < 500 && watch.wait_for(std::chrono::milliseconds(20)) != std::future_status::ready; ++i) {
    client.outcome(annotate(client, {uuid}, {{"election", Value::integer(i % 3)}}));
  }
  Subprocess::Outcome outcome = watch.get();
  EXPECT_EQ(outcome.status, 0) << outcome.err;
  EXPECT_EQ(std::count(outcome.out.begin(), outcome.out.end(), '\n'), 3);
  EXPECT_EQ(outcome.out.rfind(kAnnotationChange + " ", 0), 0u);
}

}  // namespace
