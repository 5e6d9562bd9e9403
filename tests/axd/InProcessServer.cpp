#include "tests/axd/InProcessServer.h"

#include <fcntl.h>
#include <unistd.h>

#include <cstdint>
#include <cstdlib>
#include <fstream>
#include <sstream>
#include <thread>

#if defined(__SANITIZE_ADDRESS__)
#include <sanitizer/common_interface_defs.h>
#endif

namespace {

InProcessServer* instance = nullptr;

constexpr auto kPollInterval = std::chrono::milliseconds(10);

}  // namespace

InProcessServer::InProcessServer() {
  instance = this;
}

InProcessServer& InProcessServer::shared() {
  return *instance;
}

void InProcessServer::SetUp() {
  ASSERT_FALSE(root_.path().empty());
  // Both are read when first needed, so they must be in place before anything logs.
  setenv("ANNEXA_ROOT", root_.path().c_str(), 1);
  setenv("AXD_LOG", "stderr", 1);
  logPath_ = root_ / "axd.log";
  int log = open(logPath_.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
  ASSERT_GE(log, 0);
  savedStderr_ = fcntl(STDERR_FILENO, F_DUPFD_CLOEXEC, 0);
  dup2(log, STDERR_FILENO);
  close(log);
#if defined(__SANITIZE_ADDRESS__)
  // A sanitizer's report must reach the terminal, not the captured log.
  __sanitizer_set_report_fd(reinterpret_cast<void*>(static_cast<std::intptr_t>(savedStderr_)));
#endif
  built_ = AXDServer::initForService(kServiceName, nullptr);
  ASSERT_TRUE(built_) << "initForService failed";
  // What run() does before it parks the main thread for good.
  ASSERT_TRUE(built_->service()->resume().ok());
}

void InProcessServer::TearDown() {
  // Standard error stays captured: the server goes on logging while the process exits.
  if (savedStderr_ < 0 || ::testing::UnitTest::GetInstance()->Passed()) return;
  std::string report = "---- the server's log ----\n" + logText() + "---- end of log ----\n";
  ssize_t ignored = write(savedStderr_, report.data(), report.size());
  (void)ignored;
}

std::string InProcessServer::logText() const {
  std::ifstream file(logPath_, std::ios::binary);
  std::stringstream text;
  text << file.rdbuf();
  return text.str();
}

std::size_t InProcessServer::logSize() const {
  return logText().size();
}

std::vector<std::string> InProcessServer::logLines(std::size_t since) const {
  std::string text = logText();
  std::istringstream lines(since < text.size() ? text.substr(since) : std::string());
  std::vector<std::string> messages;
  for (std::string line; std::getline(lines, line);) {
    auto prefixEnd = line.find("]: ");
    messages.push_back(prefixEnd == std::string::npos ? line : line.substr(prefixEnd + 3));
  }
  return messages;
}

bool InProcessServer::waitForLog(std::string_view text, std::size_t since,
                                 std::chrono::milliseconds timeout) const {
  const auto deadline = std::chrono::steady_clock::now() + timeout;
  for (;;) {
    std::string log = logText();
    if (since < log.size() && log.find(text, since) != std::string::npos) return true;
    if (std::chrono::steady_clock::now() >= deadline) return false;
    std::this_thread::sleep_for(kPollInterval);
  }
}
