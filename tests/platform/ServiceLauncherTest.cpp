#include <gtest/gtest.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <thread>

#include "ScopedEnvironment.h"
#include "TempDirectory.h"
#include "platform/launcher/ServiceFile.h"
#include "platform/launcher/ServiceLauncher.h"
#include "platform/launcher/ServiceName.h"
#include "platform/value/Value.h"

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

  // A plug-in stand-in. It writes to "report" beside it whether it could catch SIGUSR2 (a shell
  // cannot trap what was ignored when it started), whether descriptor 47 is open, and its
  // environment.
  std::string reporter() const {
    const std::string script =
        root_.write("reporter", "#!/bin/sh\nexec > " + root_ / "report" +
                                    "\ntrap 'echo USR2=caught' USR2\nkill -USR2 $$\n"
                                    "if [ -e /proc/$$/fd/47 ]; then echo FD47=open; fi\nenv\n");
    chmod(script.c_str(), 0755);
    return script;
  }

  // Starts the stand-in recorded for this process and returns the lines of its report, sorted,
  // less the working directory that the shell exports by itself.
  std::vector<std::string> runReporter() const {
    auto started = ServiceLauncher::start("com.x.r", "1");
    EXPECT_TRUE(started.ok()) << started.error().message;
    int status = -1;
    if (started.ok()) waitpid(started.value(), &status, 0);
    EXPECT_EQ(status, 0);
    std::vector<std::string> lines;
    std::ifstream report(root_ / "report");
    for (std::string line; std::getline(report, line);) {
      if (!line.starts_with("PWD=")) lines.push_back(line);
    }
    std::sort(lines.begin(), lines.end());
    return lines;
  }

  TempDirectory root_;
  ScopedEnvironment environment_;
  const std::string executable_ = "/bin/sh";
  const Dictionary description_{
      {"ZynService", Value::dictionary({{"_SandboxProfile", Value::string("plugin")}})}};
};

TEST_F(ServiceLauncherTest, BadRequestsFailAndWriteNothing) {
  pid_t child = fork();
  if (child == 0) _exit(0);
  ASSERT_EQ(waitpid(child, nullptr, 0), child);
  const std::string plain = root_.write("plain", "#!/bin/sh\n");
  struct Case {
    pid_t host;
    std::string identifier, version, executable;
    Dictionary description;
    int errnum;
  } cases[] = {
      {child, "com.x.p", "1", executable_, description_, ESRCH},
      {0, "com.x.p", "1", executable_, description_, ESRCH},
      {getpid(), "com.x.p", "", executable_, description_, EINVAL},
      {getpid(), "com.x.p", "1", executable_, Dictionary{{"null", Value()}}, EINVAL},
      {getpid(), "com.x.p", "1", "bin/sh", description_, EINVAL},
      {getpid(), "com.x.p", "1", root_ / "missing", description_, ENOENT},
      {getpid(), "com.x.p", "1", plain, description_, EACCES},
      {getpid(), "com.x.p", "1", root_.path(), description_, EACCES},
  };
  for (const auto& c : cases) {
    auto added =
        ServiceLauncher::addService(c.host, c.identifier, c.version, c.executable, c.description);
    ASSERT_FALSE(added.ok()) << c.host << " " << c.identifier << " " << c.version << " "
                             << c.executable;
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
    ASSERT_TRUE(
        ServiceLauncher::addService(getpid(), identifier, version, executable_, description_).ok())
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

TEST_F(ServiceLauncherTest, RacingAddsAndRemovesLeaveWholeFiles) {
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([this, t] {
      for (int i = 0; i < 50; ++i) {
        if ((i + t) % 2 == 0) {
          EXPECT_TRUE(
              ServiceLauncher::addService(getpid(), "com.x.p", "1", executable_, description_)
                  .ok());
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

TEST_F(ServiceLauncherTest, StartNeedsThisProcessMadeReadyAndTheExecutable) {
  const std::string script = reporter();
  auto failure = [](const std::string& identifier, const std::string& version) {
    auto started = ServiceLauncher::start(identifier, version);
    return started.ok() ? 0 : started.error().errnum;
  };
  EXPECT_EQ(failure("com.x.r", "1"), EPERM);  // no table at all
  ASSERT_TRUE(ServiceLauncher::addService(getppid(), "com.x.r", "1", script, description_).ok());
  ASSERT_TRUE(ServiceLauncher::addService(getpid(), "com.x.r", "2", script, description_).ok());
  EXPECT_EQ(failure("com.x.r", "1"), EPERM);  // made ready for another process only
  EXPECT_EQ(failure(std::string(300, 'x'), "2"), EPERM);
  EXPECT_EQ(failure("", "2"), EINVAL);
  // A record that an earlier process with this pid left is not this process's.
  const std::string own =
      root_ / ("run/launcher/" + launcher::ServiceName::escape("com.x.r") + "/" +
               launcher::ServiceName::escape("2") + "/" + std::to_string(getpid()) + ".plist");
  std::ofstream(own, std::ios::trunc)
      << launcher::ServiceFile::encode({script, description_, 1}).value();
  EXPECT_EQ(failure("com.x.r", "2"), EPERM);
  ASSERT_TRUE(ServiceLauncher::addService(getpid(), "com.x.r", "2", script, description_).ok());
  ASSERT_EQ(unlink(script.c_str()), 0);
  EXPECT_EQ(failure("com.x.r", "2"), ENOENT);
}

TEST_F(ServiceLauncherTest, StartGivesThePlugInOnlyWhatItsDescriptionSays) {
  // The host's own variable, ignored signal and open descriptor must not reach the plug-in.
  environment_.set("AXD_HOST_ONLY", "1");
  sighandler_t usr2 = signal(SIGUSR2, SIG_IGN);
  ASSERT_EQ(dup2(STDERR_FILENO, 47), 47);
  const Value variables = Value::dictionary({{"HOME", Value::string("/container")},
                                             {"SPACED", Value::string("a b=c")},
                                             {"EMPTY", Value::string("")},
                                             {"NUMBER", Value::integer(1)},
                                             {"A=B", Value::string("c")}});
  const std::pair<Dictionary, std::vector<std::string>> cases[] = {
      {{{"ZynService", Value::dictionary({{"EnvironmentVariables", variables}})}},
       {"EMPTY=", "HOME=/container", "SPACED=a b=c", "USR2=caught"}},
      {description_, {"USR2=caught"}},
  };
  for (const auto& [description, expected] : cases) {
    ASSERT_TRUE(
        ServiceLauncher::addService(getpid(), "com.x.r", "1", reporter(), description).ok());
    EXPECT_EQ(runReporter(), expected) << description.size();
  }
  close(47);
  signal(SIGUSR2, usr2);
}

}  // namespace
