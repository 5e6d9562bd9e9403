// The user's elections through the real daemon when their file is damaged, foreign, or cannot be
// written: nothing acknowledged is lost, nothing unsaved is acknowledged, and a file the daemon
// cannot read is kept, not overwritten.

#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <string>
#include <vector>

#include "Annexa/AXProtocol.h"
#include "platform/launcher/ServiceLauncher.h"
#include "platform/value/PropertyList.h"
#include "tests/e2e/Bundles.h"
#include "tests/e2e/DaemonTest.h"
#include "tests/platform/TempDirectory.h"

namespace {

using value::Dictionary;
using value::Value;

Dictionary election(std::int64_t value) {
  return {{"election", Value::integer(value)}};
}

class UserDataTest : public DaemonTest {
 protected:
  // Registers plug-in |id| through the daemon and returns its UUID.
  value::Uuid install(const std::string& id) {
    std::string path =
        bundles::plugIn(root() + "/Applications", "Notes", {.id = id, .executable = "/bin/true"});
    EXPECT_EQ(send(AXProtocol::kAdd, {path}), "ok");
    return uuid(path);
  }
  std::string elect(const value::Uuid& uuid, std::int64_t value) {
    auto request = client().client().request(AXProtocol::kAnnotate, {uuid}, 0);
    request[AXProtocol::kAnnotations] = Value::dictionary(election(value));
    return client().outcome(request);
  }
  // The election discovery shows for |id|, or null when it shows none.
  Value shown(const std::string& id) {
    value::Array forms = match(Value::dictionary({{"QSExtensionIdentifier", Value::string(id)}}));
    if (forms.size() != 1) return Value();
    const Value* annotations = forms[0].asDictionary()->find("annotations");
    const Value* found = annotations ? annotations->asDictionary()->find("election") : nullptr;
    return found ? *found : Value();
  }
  // The files beside the annotation file whose names start with "Annotations.rejected-".
  std::vector<std::string> keptAside() {
    std::vector<std::string> kept;
    for (const auto& entry : std::filesystem::directory_iterator(home_.path())) {
      std::string name = entry.path().filename();
      if (name.starts_with("Annotations.rejected-")) kept.push_back(entry.path());
    }
    return kept;
  }

  // The executable the launcher has recorded for |id| for this process; empty when none.
  static std::string recordedExecutable(const std::string& id) {
    auto services = launcher::ServiceLauncher::services();
    if (!services.ok()) return "";
    for (const auto& service : services.value()) {
      if (service.host == getpid() && service.bundleIdentifier == id) return service.executablePath;
    }
    return "";
  }
  // Limits the size of any file the daemon writes to |bytes|, as a full disk would.
  void limitDaemonWrites(rlim_t bytes) {
    struct rlimit limit {
      bytes, RLIM_INFINITY
    };
    ASSERT_EQ(prlimit(daemon().pid(), RLIMIT_FSIZE, &limit, nullptr), 0);
  }

  TempDirectory home_;
  std::string file_ = home_ / "Annotations";
};

TEST_F(UserDataTest, AFileTheDaemonCannotReadIsKeptBesideTheNewOne) {
  const Value future =
      Value::dictionary({{"version", Value::integer(17)},
                         {"data", Value::dictionary({{"later", Value::dictionary(election(5))}})}});
  bundles::writePlist(file_, future);
  ASSERT_TRUE(start({"-d", file_}));
  value::Uuid uuid = install("kept.tool");
  EXPECT_TRUE(keptAside().empty()) << "nothing is moved before the first change";

  ASSERT_EQ(elect(uuid, 1), "ok");
  std::vector<std::string> kept = keptAside();
  ASSERT_EQ(kept.size(), 1u);
  EXPECT_EQ(value::PropertyList::readFile(kept[0]).value(), future);
  EXPECT_EQ(logCount("kept rejected annotation database as " + kept[0]), 1u);
  auto written = value::PropertyList::readFile(file_);
  ASSERT_TRUE(written.ok()) << written.error().message;
  EXPECT_EQ(*written.value().asDictionary()->find("version"), Value::integer(16));
}

TEST_F(UserDataTest, AnElectionThatCannotBeSavedIsRefusedAndNotShown) {
  ASSERT_TRUE(start({"-d", file_}));
  value::Uuid uuid = install("unsaved.tool");
  ASSERT_EQ(elect(uuid, 1), "ok");

  // A directory where the file belongs: no save can replace it.
  std::filesystem::remove(file_);
  std::filesystem::create_directory(file_);
  std::string refused = elect(uuid, 2);
  EXPECT_EQ(refused.rfind("4: unable to save annotations: ", 0), 0u) << refused;
  EXPECT_EQ(shown("unsaved.tool"), Value::integer(1));

  std::filesystem::remove(file_);
  ASSERT_EQ(elect(uuid, 3), "ok");
  EXPECT_EQ(shown("unsaved.tool"), Value::integer(3));
  expectServing();
}

// The disk refuses the daemon's writes part way (a file-size limit, as a full file system would):
// the host is told, and what the daemon saved before still loads.
TEST_F(UserDataTest, AWriteCutShortIsRefusedAndTheSavedFilesStillLoad) {
  ASSERT_TRUE(start({"-d", file_}));
  value::Uuid kept = install("saved.tool");
  value::Uuid later = install("later.tool");
  ASSERT_EQ(elect(kept, 1), "ok");
  ASSERT_EQ(send(AXProtocol::kReady, {kept}), "ok");
  std::string executable = recordedExecutable("saved.tool");
  ASSERT_FALSE(executable.empty());

  limitDaemonWrites(64);
  std::string refused = elect(kept, 2);
  EXPECT_EQ(refused.rfind("4: unable to save annotations: ", 0), 0u) << refused;
  EXPECT_EQ(send(AXProtocol::kReady, {later}).rfind("4: unable to enable plug-in", 0), 0u);
  EXPECT_EQ(send(AXProtocol::kReady, {kept}).rfind("4: unable to enable plug-in", 0), 0u);
  EXPECT_EQ(recordedExecutable("saved.tool"), executable) << "the record was not kept whole";
  EXPECT_EQ(recordedExecutable("later.tool"), "");
  for (const auto& entry : std::filesystem::directory_iterator(home_.path())) {
    EXPECT_EQ(entry.path(), file_) << "a temporary file was left behind";
  }

  limitDaemonWrites(RLIM_INFINITY);
  ASSERT_TRUE(restart());
  EXPECT_EQ(shown("saved.tool"), Value::integer(1));
  EXPECT_EQ(send(AXProtocol::kReady, {later}), "ok");
}

TEST_F(UserDataTest, AFifoAtTheAnnotationPathDoesNotStallStartUp) {
  ASSERT_EQ(mkfifo(file_.c_str(), 0600), 0);
  ASSERT_TRUE(start({"-d", file_}));
  EXPECT_EQ(logCount(file_ + " is not a regular file"), 1u);
  value::Uuid uuid = install("fifo.tool");
  ASSERT_EQ(elect(uuid, 1), "ok");
  EXPECT_EQ(keptAside().size(), 1u);
  EXPECT_EQ(shown("fifo.tool"), Value::integer(1));
}

}  // namespace
