#include "tests/support/DaemonProcess.h"

#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string_view>
#include <thread>

#include "Annexa/AXDaemonClient.h"
#include "platform/os/Paths.h"

namespace {

constexpr auto kPollInterval = std::chrono::milliseconds(10);
constexpr int kPollsBeforeKill = 500;

std::optional<std::string> environmentRoot() {
  const char* root = std::getenv("ANNEXA_ROOT");
  return root ? std::optional<std::string>(root) : std::nullopt;
}

// True when a listener has taken the socket: the file alone appears before listen().
bool accepts(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (path.size() >= sizeof address.sun_path) return false;
  std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
  int probe = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (probe < 0) return false;
  bool live = connect(probe, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
  close(probe);
  return live;
}

std::string describeExit(int status) {
  if (WIFSIGNALED(status)) return "killed by signal " + std::to_string(WTERMSIG(status));
  return "exit status " + std::to_string(WEXITSTATUS(status));
}

}  // namespace

os::Result<std::unique_ptr<DaemonProcess>> DaemonProcess::start(const std::string& executable,
                                                                const Options& options,
                                                                std::chrono::milliseconds timeout) {
  char pattern[] = "/tmp/axd-root-XXXXXX";
  if (!mkdtemp(pattern)) return os::Error::fromErrno("mkdtemp");
  std::unique_ptr<DaemonProcess> daemon(new DaemonProcess(pattern, options));
  os::Status started = daemon->spawn(executable);
  if (!started.ok()) return started.error();
  os::Status listening = daemon->waitUntilListening(timeout);
  if (!listening.ok())
    return os::Error{listening.error().errnum, executable + ": " + listening.error().message};
  return daemon;
}

os::Status DaemonProcess::restart(const std::string& executable,
                                  std::chrono::milliseconds timeout) {
  stop();
  os::Status started = spawn(executable);
  if (!started.ok()) return started;
  return waitUntilListening(timeout);
}

DaemonProcess::DaemonProcess(std::string root, Options options)
    : root_(std::move(root)), options_(std::move(options)), previousRoot_(environmentRoot()) {
  setenv("ANNEXA_ROOT", root_.c_str(), 1);
}

DaemonProcess::~DaemonProcess() {
  stop();
  if (previousRoot_) {
    setenv("ANNEXA_ROOT", previousRoot_->c_str(), 1);
  } else {
    unsetenv("ANNEXA_ROOT");
  }
  std::error_code ignored;
  std::filesystem::remove_all(root_, ignored);
}

std::string DaemonProcess::socketPath() {
  return os::Paths::zynSocketDir() + "/" + AXDaemonClient::defaultServiceName();
}

std::string DaemonProcess::servicePath() const {
  if (options_.serviceName.empty()) return socketPath();
  return os::Paths::zynSocketDir() + "/" + options_.serviceName;
}

os::Status DaemonProcess::spawn(const std::string& executable) {
  std::vector<std::string> words{executable};
  words.insert(words.end(), options_.arguments.begin(), options_.arguments.end());
  std::vector<char*> argv;
  for (auto& word : words) argv.push_back(word.data());
  argv.push_back(nullptr);
  std::vector<std::string> settings;
  for (char** variable = environ; *variable; ++variable) {
    std::string_view setting(*variable);
    std::string name(setting.substr(0, setting.find('=')));
    if (name != "AXD_LOG" && !options_.environment.contains(name)) settings.emplace_back(setting);
  }
  for (const auto& [name, value] : options_.environment) settings.push_back(name + "=" + value);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  if (options_.captureLog) {
    settings.emplace_back("AXD_LOG=stderr");
    std::string log = root_ + "/axd.log";
    posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, log.c_str(),
                                     O_WRONLY | O_CREAT | O_APPEND, 0644);
  }
  std::vector<char*> envp;
  for (auto& setting : settings) envp.push_back(setting.data());
  envp.push_back(nullptr);
  int failed = posix_spawn(&pid_, executable.c_str(), &actions, nullptr, argv.data(), envp.data());
  posix_spawn_file_actions_destroy(&actions);
  if (failed == 0) return os::success();
  pid_ = 0;
  return os::Error{failed, "cannot start " + executable + ": " + std::strerror(failed)};
}

bool DaemonProcess::running() {
  if (pid_ <= 0) return false;
  if (waitpid(pid_, nullptr, WNOHANG) != pid_) return true;
  pid_ = 0;
  return false;
}

std::string DaemonProcess::log() const {
  std::ifstream file(root_ + "/axd.log");
  std::stringstream text;
  text << file.rdbuf();
  return text.str();
}

bool DaemonProcess::waitForLog(const std::string& text, std::chrono::milliseconds timeout) const {
  const auto deadline = std::chrono::steady_clock::now() + timeout;
  while (log().find(text) == std::string::npos) {
    if (std::chrono::steady_clock::now() >= deadline) return false;
    std::this_thread::sleep_for(kPollInterval);
  }
  return true;
}

os::Status DaemonProcess::waitUntilListening(std::chrono::milliseconds timeout) {
  const std::string path = servicePath();
  const auto deadline = std::chrono::steady_clock::now() + timeout;
  while (!accepts(path)) {
    int status = 0;
    if (waitpid(pid_, &status, WNOHANG) == pid_) {
      pid_ = 0;
      return os::Error{ECHILD, "exited before listening (" + describeExit(status) + ")"};
    }
    if (std::chrono::steady_clock::now() >= deadline) {
      return os::Error{ETIMEDOUT, "no listener at " + path + " in time"};
    }
    std::this_thread::sleep_for(kPollInterval);
  }
  return os::success();
}

void DaemonProcess::stop() {
  if (pid_ <= 0) return;
  kill(pid_, SIGTERM);
  for (int i = 0; i < kPollsBeforeKill; ++i) {
    if (waitpid(pid_, nullptr, WNOHANG) == pid_) return;
    std::this_thread::sleep_for(kPollInterval);
  }
  kill(pid_, SIGKILL);
  waitpid(pid_, nullptr, 0);
}
