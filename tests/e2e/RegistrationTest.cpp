// Registration and elections through the real daemon: add, remove, annotate into the file that
// -d names, and the notices that cross processes: the registry's of an uninstall, and the
// annotation change that axctl watch follows. The annotation file itself is tested in-process.

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <future>
#include <string>
#include <vector>

#include "Annexa/AXProtocol.h"
#include "platform/registrum/Workspace.h"
#include "platform/value/PropertyList.h"
#include "tests/e2e/Bundles.h"
#include "tests/e2e/DaemonTest.h"
#include "tests/platform/TempDirectory.h"

namespace {

using value::Dictionary;
using value::Value;

const std::string kManager = AXD_VENDOR_PREFIX ".private.annexa.manager";
const std::string kAnnotationChange = AXD_VENDOR_PREFIX ".annexa.annotation-change";

class RegistrationTest : public DaemonTest {
 protected:
  // Writes plug-in |id| into the application |app|; returns its path.
  std::string bundle(const std::string& app, const std::string& id) {
    return bundles::plugIn(root() + "/Applications", app, {.id = id});
  }
  // Registers plug-in |id| through the daemon and returns its UUID.
  value::Uuid install(const std::string& id) {
    std::string path = bundle("Notes", id);
    EXPECT_EQ(send(AXProtocol::kAdd, {path}), "ok");
    return uuid(path);
  }
  std::string annotate(const std::vector<value::Uuid>& uuids, const Dictionary& annotations) {
    auto request = client().client().request(AXProtocol::kAnnotate, uuids, 0);
    request[AXProtocol::kAnnotations] = Value::dictionary(annotations);
    return client().outcome(request);
  }
  TempDirectory home_;
  std::string file_ = home_ / "Annotations";
};

TEST_F(RegistrationTest, AddStopsAtTheFirstBadPathAndKeepsWhatCameBefore) {
  ASSERT_TRUE(start());
  std::string good = bundle("Notes", "add.good");
  std::string later = bundle("Notes", "add.later");
  EXPECT_EQ(send(AXProtocol::kAdd, {good, "Notes.app/PlugIns/x.appex", later}),
            "9: absolute path required: Notes.app/PlugIns/x.appex");
  EXPECT_TRUE(record(good));
  EXPECT_FALSE(record(later));

  EXPECT_EQ(send(AXProtocol::kAdd, {root() + "/missing.appex"}),
            "9: invalid plugin path: " + root() + "/missing.appex");
  std::string empty = root() + "/Empty.appex";
  std::filesystem::create_directories(empty);
  EXPECT_EQ(send(AXProtocol::kAdd, {empty}), "2: unable to register plug-in at " + empty);
  auto request = client().client().request(AXProtocol::kAdd);
  request[AXProtocol::kPaths] = Value::string(good);
  EXPECT_EQ(client().outcome(request), "4: invalid request format");

  // A symbolic link is registered as the bundle it resolves to.
  std::string link = root() + "/link.appex";
  std::filesystem::create_directory_symlink(later, link);
  EXPECT_EQ(send(AXProtocol::kAdd, {link}), "ok");
  EXPECT_TRUE(record(later));
}

TEST_F(RegistrationTest, RemoveNeedsTheManagerEntitlement) {
  ASSERT_TRUE(start());
  std::string path = bundle("Notes", "remove.me");
  ASSERT_EQ(send(AXProtocol::kAdd, {path}), "ok");
  EXPECT_EQ(send(AXProtocol::kRemove, {path}), "11: caller lacks entitlement for this operation");
  EXPECT_TRUE(record(path));

  grant({{kManager, Value::boolean(true)}});
  EXPECT_EQ(send(AXProtocol::kRemove, {path}), "ok");
  EXPECT_FALSE(record(path));
  EXPECT_EQ(send(AXProtocol::kRemove, {"/does/not/exist.appex"}),
            "9: no plugin at /does/not/exist.appex");
}

// What the daemon does on an uninstall is in UseTest; here, that the registry's notice reaches
// it from another process.
TEST_F(RegistrationTest, AnUninstallByAnotherProcessReachesTheDaemon) {
  ASSERT_TRUE(start());
  ASSERT_EQ(send(AXProtocol::kAdd, {bundle("Widgets", "widget.one")}), "ok");
  ASSERT_TRUE(daemon().waitForLog("INSTALLED:widget.one widget.one(1.0)"));
  auto registry = registrum::Workspace::open(root());
  ASSERT_TRUE(registry.ok());
  ASSERT_TRUE(registry.value()->uninstallApplication(root() + "/Applications/Widgets.app").ok());
  EXPECT_TRUE(daemon().waitForLog("UNINSTALLED:widget.one widget.one(1.0)"));
}

// A plug-in updated in place keeps its path and UUID; the daemon must serve what it says now.
TEST_F(RegistrationTest, APlugInRegisteredAgainIsServedAsItIsNow) {
  ASSERT_TRUE(start());
  const std::string path = bundle("Notes", "updated");
  ASSERT_EQ(send(AXProtocol::kAdd, {path}), "ok");
  auto version = [&] {
    value::Array forms =
        match(Value::dictionary({{"QSExtensionIdentifier", Value::string("updated")}}));
    const Value* found = forms.size() == 1 ? forms[0].asDictionary()->find("version") : nullptr;
    return found && found->asString() ? *found->asString() : std::string("none");
  };
  ASSERT_EQ(version(), "1.0");
  bundles::writePlugIn(path, {.id = "updated", .version = "2.0"});
  auto registry = registrum::Workspace::open(root());
  ASSERT_TRUE(registry.ok());
  ASSERT_TRUE(registry.value()->registerPlugIn(path).ok());
  ASSERT_TRUE(daemon().waitForLog("INSTALLED:updated updated(2.0)"));
  EXPECT_EQ(logCount("UNINSTALLED:updated updated(1.0)"), 1u);
  EXPECT_EQ(version(), "2.0");
}

TEST_F(RegistrationTest, AnnotateChecksEveryFieldBeforeStoringAnything) {
  ASSERT_TRUE(start({"-d", file_}));
  value::Uuid first = install("annotate.first");
  value::Uuid second = install("annotate.second");
  EXPECT_EQ(annotate({first}, {{"election", Value::string("1")}}),
            "4: invalid request format (annotation election)");
  EXPECT_EQ(annotate({first}, {{"election", Value::integer(1)}, {"extension", Value::array({})}}),
            "4: invalid request format (annotation extension)");
  // Values the wire carries but the file cannot hold are refused like wrong types.
  EXPECT_EQ(annotate({first}, {{"election", Value::unsignedInteger(UINT64_MAX)}}),
            "4: invalid request format (annotation election)");
  EXPECT_EQ(annotate({first}, {{"extension", Value::dictionary({{"id", Value::uuid(first)}})}}),
            "4: invalid request format (annotation extension)");
  EXPECT_EQ(annotate({}, {{"other", Value::integer(1)}}), "ok");
  EXPECT_FALSE(std::filesystem::exists(file_));  // nothing stored, so nothing written

  EXPECT_EQ(annotate({first, value::Uuid::random()}, {{"election", Value::integer(2)}}),
            "4: no such plugin (uuid not found)");
  const Dictionary extension{{"extension", Value::dictionary({})}};
  EXPECT_EQ(annotate({second}, extension.with("other", Value::integer(1))), "ok");
  auto written = value::PropertyList::readFile(file_);
  ASSERT_TRUE(written.ok()) << written.error().message;
  EXPECT_EQ(
      written.value(),
      Value::dictionary(
          {{"version", Value::integer(16)},
           {"data", Value::dictionary({
                        {"annotate.first", Value::dictionary({{"election", Value::integer(2)}})},
                        {"annotate.second", Value::dictionary(extension)},
                    })}}));
  // Discovery returns what was stored, and its rules read the election.
  value::Array forms = match(Value::dictionary({{"QSUserElection", Value::string("2")}}));
  ASSERT_EQ(forms.size(), 1u);
  const Value* annotations = forms[0].asDictionary()->find("annotations");
  EXPECT_EQ(annotations ? *annotations : Value(),
            Value::dictionary({{"election", Value::integer(2)}}));
}

TEST_F(RegistrationTest, AForeignAnnotationEntryCostsNoElection) {
  const Dictionary second{{"election", Value::integer(3)},
                          {"extension", Value::dictionary({{"k", Value::string("v")}})}};
  bundles::writePlist(
      file_, Value::dictionary({
                 {"version", Value::integer(16)},
                 {"data", Value::dictionary({
                              {"kept.first", Value::dictionary({{"election", Value::integer(1)}})},
                              {"foreign", Value::string("not an annotation")},
                              {"kept.second", Value::dictionary(second)},
                          })},
             }));
  ASSERT_TRUE(start({"-d", file_}));
  install("kept.first");
  value::Uuid uuid = install("kept.second");
  EXPECT_EQ(logCount("skipping annotation \"foreign\" of " + file_ + ": not a dictionary"), 1u);
  EXPECT_EQ(logCount("unable to load annotation database"), 0u);
  auto elected = [&](const char* election) {
    std::vector<std::string> ids;
    for (const Value& form :
         match(Value::dictionary({{"QSUserElection", Value::string(election)}}))) {
      ids.push_back(*form.asDictionary()->find("identifier")->asString());
    }
    return ids;
  };
  EXPECT_EQ(elected("1"), std::vector<std::string>{"kept.first"});
  EXPECT_EQ(elected("3"), std::vector<std::string>{"kept.second"});

  // The next save keeps every election; only the foreign entry is gone.
  ASSERT_EQ(annotate({uuid}, {{"election", Value::integer(2)}}), "ok");
  auto written = value::PropertyList::readFile(file_);
  ASSERT_TRUE(written.ok()) << written.error().message;
  const Value* data = written.value().asDictionary()->find("data");
  ASSERT_TRUE(data);
  EXPECT_EQ(*data,
            Value::dictionary({
                {"kept.first", Value::dictionary({{"election", Value::integer(1)}})},
                {"kept.second", Value::dictionary(second.with("election", Value::integer(2)))},
            }));
}

// A binary file can hold a string with a NUL byte, which the XML the daemon saves cannot: kept,
// such an entry would make every later save fail.
TEST_F(RegistrationTest, AnAnnotationTheDaemonCannotSaveIsSkippedAtLoad) {
  // {"version": 16, "data": {"kept.first": {"election": 1},
  //                          "nul.inside": {"election": 2, "note": "\u00e9\0b"}}}, binary,
  // the string in UTF-16 (an ASCII string would be cut at the NUL as it is read).
  const std::string hex =
      "62706c6973743030d20102030d54646174615776657273696f6ed2040506095a6b6570742e6669727374"
      "5a6e756c2e696e73696465d1070858656c656374696f6e1001d2070a0b0c546e6f746510026300e90000"
      "00621010080d121a1f2a35384143484d4f560000000000000101000000000000000e0000000000000000"
      "0000000000000058";
  std::string bytes;
  for (std::size_t i = 0; i < hex.size(); i += 2) {
    bytes.push_back(static_cast<char>(std::stoi(hex.substr(i, 2), nullptr, 16)));
  }
  std::ofstream(file_, std::ios::binary) << bytes;
  ASSERT_TRUE(start({"-d", file_}));
  value::Uuid uuid = install("kept.first");
  EXPECT_EQ(logCount("skipping annotation \"nul.inside\" of " + file_ +
                     ": property-list text cannot hold NUL"),
            1u);
  EXPECT_EQ(annotate({uuid}, {{"election", Value::integer(3)}}), "ok");
}

TEST_F(RegistrationTest, WatchSeesTheChanges) {
  ASSERT_TRUE(start());
  value::Uuid uuid = install("watched");
  auto watch = std::async(std::launch::async, [&] {
    return axctl({"watch", kAnnotationChange, "--count", "3"});
  });
  // The watcher reports only changes after it started, so change until it has seen three.
  for (int i = 0;
       i < 500 && watch.wait_for(std::chrono::milliseconds(20)) != std::future_status::ready; ++i) {
    annotate({uuid}, {{"election", Value::integer(i % 3)}});
  }
  Subprocess::Outcome outcome = watch.get();
  EXPECT_EQ(outcome.status, 0) << outcome.err;
  EXPECT_EQ(std::count(outcome.out.begin(), outcome.out.end(), '\n'), 3);
  EXPECT_EQ(outcome.out.rfind(kAnnotationChange + " ", 0), 0u);
}

}  // namespace
