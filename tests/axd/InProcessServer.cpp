#include "tests/axd/InProcessServer.h"

#include <fcntl.h>
#include <unistd.h>

#include <cstdlib>
#include <fstream>
#include <sstream>
#include <thread>

#include "platform/os/Paths.h"

namespace {

std::shared_ptr<AXDServer>& theServer() {
  static auto* server = new std::shared_ptr<AXDServer>();
  return *server;
}

std::string& theRoot() {
  static auto* root = new std::string();
  return *root;
}

}  // namespace

void InProcessServer::setUp() {
  char pattern[] = "/tmp/axd-inprocess-XXXXXX";
  theRoot() = mkdtemp(pattern);
  setenv("ANNEXA_ROOT", theRoot().c_str(), 1);
  setenv("AXD_LOG", "stderr", 1);
  int log = open((theRoot() + "/axd.log").c_str(), O_WRONLY | O_CREAT | O_APPEND, 0644);
  dup2(log, STDERR_FILENO);
  close(log);
  theServer() = AXDServer::initForService("test.axd", nullptr);
  theServer()->setVerbose(2);
  theServer()->service()->resume();
}

const std::shared_ptr<AXDServer>& InProcessServer::server() {
  return theServer();
}

const std::string& InProcessServer::root() {
  return theRoot();
}

std::string InProcessServer::socketPath() {
  return os::Paths::zynSocketDir() + "/test.axd";
}

std::string InProcessServer::log() {
  std::ifstream file(theRoot() + "/axd.log");
  std::stringstream text;
  text << file.rdbuf();
  return text.str();
}

std::size_t InProcessServer::occurrences(const std::string& text) {
  std::string all = log();
  std::size_t count = 0;
  for (std::size_t at = 0; (at = all.find(text, at)) != std::string::npos; at += text.size()) {
    ++count;
  }
  return count;
}

bool InProcessServer::waitForLog(const std::string& text, std::size_t count,
                                 std::chrono::milliseconds timeout) {
  const auto deadline = std::chrono::steady_clock::now() + timeout;
  while (occurrences(text) < count) {
    if (std::chrono::steady_clock::now() >= deadline) return false;
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  }
  return true;
}
