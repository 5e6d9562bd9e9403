#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <future>
#include <thread>

#include "ScopedEnvironment.h"
#include "TempDirectory.h"
#include "platform/launcher/ServiceLauncher.h"
#include "platform/value/Value.h"
#include "platform/zyn/ThreadQueue.h"

namespace {

using launcher::ServiceLauncher;
using value::Dictionary;
using value::Value;

class ServiceLauncherTest : public ::testing::Test {
 protected:
  void SetUp() override { environment_.set("ANNEXA_ROOT", root_.path()); }

  // The table's files other than its lock, relative to the table directory.
  std::vector<std::string> files() const {
    std::vector<std::string> found;
    for (const auto& entry :
         std::filesystem::recursive_directory_iterator(root_ / "run/launcher")) {
      std::string name = entry.path().lexically_relative(root_ / "run/launcher");
      if (entry.is_regular_file() && name != ".lock") found.push_back(name);
    }
    return found;
  }

  // (host, identifier, version) of every listed service, in the listed order.
  static std::vector<std::tuple<pid_t, std::string, std::string>> listed() {
    auto services = ServiceLauncher::services();
    std::vector<std::tuple<pid_t, std::string, std::string>> triples;
    EXPECT_TRUE(services.ok()) << services.error().message;
    if (!services.ok()) return triples;
    for (const auto& s : services.value())
      triples.emplace_back(s.host, s.bundleIdentifier, s.version);
    return triples;
  }

  TempDirectory root_;
  ScopedEnvironment environment_;
  const Dictionary description_{
      {"ZynService", Value::dictionary({{"_SandboxProfile", Value::string("plugin")}})}};
};

TEST_F(ServiceLauncherTest, RemovalReachesEveryHostAndOnlyThatVersion) {
  for (pid_t host : {getppid(), getpid()}) {
    ASSERT_TRUE(ServiceLauncher::addService(host, "com.x.p", "1", description_).ok());
  }
  // A second addition of one triple replaces the first.
  ASSERT_TRUE(ServiceLauncher::addService(getpid(), "com.x.p", "2", description_).ok());
  ASSERT_TRUE(ServiceLauncher::addService(getpid(), "com.x.p", "2", Dictionary()).ok());
  auto services = ServiceLauncher::services();
  ASSERT_TRUE(services.ok());
  ASSERT_EQ(services.value().size(), 3u);
  for (const auto& s : services.value()) {
    EXPECT_EQ(s.description, s.version == "2" ? Dictionary() : description_) << s.host;
  }

  EXPECT_EQ(ServiceLauncher::removeService("com.x.p", "1"), 0);
  EXPECT_EQ(listed(), (decltype(listed()){{getpid(), "com.x.p", "2"}}));
  EXPECT_EQ(ServiceLauncher::removeService("com.x.p", "1"), ServiceLauncher::kNoSuchService);
  EXPECT_EQ(ServiceLauncher::removeService("com.x.p", "2"), 0);
  EXPECT_TRUE(files().empty());
}

TEST_F(ServiceLauncherTest, BadRequestsFailAndWriteNothing) {
  pid_t child = fork();
  if (child == 0) _exit(0);
  ASSERT_EQ(waitpid(child, nullptr, 0), child);
  struct Case {
    pid_t host;
    std::string identifier, version;
    Dictionary description;
    int errnum;
  } cases[] = {
      {child, "com.x.p", "1", description_, ESRCH},
      {0, "com.x.p", "1", description_, ESRCH},
      {getpid(), "", "1", description_, EINVAL},
      {getpid(), "com.x.p", "", description_, EINVAL},
      {getpid(), "com.x.p", "1", Dictionary{{"null", Value()}}, EINVAL},
  };
  for (const auto& c : cases) {
    auto added = ServiceLauncher::addService(c.host, c.identifier, c.version, c.description);
    ASSERT_FALSE(added.ok()) << c.host << " " << c.identifier << " " << c.version;
    EXPECT_EQ(added.error().errnum, c.errnum) << added.error().message;
  }
  EXPECT_TRUE(listed().empty());
  EXPECT_EQ(ServiceLauncher::removeService("", "1"), EINVAL);
  EXPECT_EQ(ServiceLauncher::removeService(std::string(300, 'x'), "1"),
            ServiceLauncher::kNoSuchService);
}

TEST_F(ServiceLauncherTest, AnyNameRoundTripsAndStaysDistinct) {
  const std::vector<std::pair<std::string, std::string>> names = {{"a/b", "1"},
                                                                  {"a%2Fb", "1"},
                                                                  {"..", "."},
                                                                  {".hidden", "../1"},
                                                                  {"x", std::string("1\0/", 3)}};
  for (const auto& [identifier, version] : names) {
    ASSERT_TRUE(ServiceLauncher::addService(getpid(), identifier, version, description_).ok())
        << identifier;
  }
  decltype(listed()) expected;
  for (const auto& [identifier, version] : names)
    expected.emplace_back(getpid(), identifier, version);
  std::sort(expected.begin(), expected.end());
  EXPECT_EQ(listed(), expected);

  // Hand-made leftovers that are not services are skipped, not fatal.
  root_.write("run/launcher/a%2Fb/1/junk", "");
  root_.write("run/launcher/a%2Fb/1/17.plist", "not a property list");
  EXPECT_EQ(listed(), expected);

  EXPECT_EQ(ServiceLauncher::removeService("a/b", "1"), 0);
  expected.erase(std::find(expected.begin(), expected.end(), std::tuple(getpid(), "a/b", "1")));
  EXPECT_EQ(listed(), expected);
}

TEST_F(ServiceLauncherTest, AsyncRemovalCompletesOnTheQueue) {
  ASSERT_TRUE(ServiceLauncher::addService(getpid(), "com.x.p", "1", description_).ok());
  std::promise<std::pair<int, bool>> done;
  auto queue = std::make_shared<zyn::ThreadQueue>("launcher-test");
  ServiceLauncher::removeService("com.x.p", "1", queue, [&](int result) {
    done.set_value({result, queue->isCurrent()});
  });
  EXPECT_EQ(done.get_future().get(), std::pair(0, true));
  EXPECT_TRUE(listed().empty());
}

TEST_F(ServiceLauncherTest, RacingAddsAndRemovesLeaveWholeFiles) {
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([this, t] {
      for (int i = 0; i < 50; ++i) {
        if ((i + t) % 2 == 0) {
          EXPECT_TRUE(ServiceLauncher::addService(getpid(), "com.x.p", "1", description_).ok());
        } else {
          int result = ServiceLauncher::removeService("com.x.p", "1");
          EXPECT_TRUE(result == 0 || result == ServiceLauncher::kNoSuchService) << result;
        }
      }
    });
  }
  for (auto& thread : threads) thread.join();
  auto services = ServiceLauncher::services();
  ASSERT_TRUE(services.ok());
  for (const auto& service : services.value()) EXPECT_EQ(service.description, description_);
  for (const auto& name : files())
    EXPECT_EQ(name, "com.x.p/1/" + std::to_string(getpid()) + ".plist");
}

}  // namespace
