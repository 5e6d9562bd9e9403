#include "tests/e2e/DaemonTest.h"

#include <unistd.h>

#include <sstream>

#include "tests/support/BlockingClient.h"

bool DaemonTest::start(const std::vector<std::string>& arguments, const std::string& serviceName,
                       const std::map<std::string, std::string>& environment) {
  // The old daemon puts ANNEXA_ROOT back when it goes, so it must go before the new one sets it.
  daemon_.reset();
  serviceName_ = serviceName;
  DaemonProcess::Options options{.arguments = arguments,
                                 .serviceName = serviceName,
                                 .captureLog = true,
                                 .environment = environment};
  auto started = DaemonProcess::start(AXD_EXECUTABLE, options);
  if (!started.ok()) {
    ADD_FAILURE() << "axd did not start: " << started.error().message;
    return false;
  }
  daemon_ = std::move(started).value();
  return true;
}

void DaemonTest::expectServing() {
  EXPECT_TRUE(daemon_->running());
  BlockingClient fresh(serviceName_.empty() ? nullptr : serviceName_.c_str());
  EXPECT_EQ(fresh.bulk(0), "ok");
}

std::unique_ptr<RawClient> DaemonTest::connectRaw() {
  auto connected = RawClient::connect(daemon_->servicePath());
  if (!connected.ok()) {
    ADD_FAILURE() << connected.error().message;
    return nullptr;
  }
  return std::move(connected).value();
}

Subprocess::Outcome DaemonTest::axctl(const std::vector<std::string>& arguments) {
  return Subprocess::run(AXCTL_EXECUTABLE, arguments, {{"ANNEXA_ROOT", daemon_->root()}});
}

std::string DaemonTest::thisClient() {
  return "client " + std::to_string(getpid());
}

std::size_t DaemonTest::logCount(std::string_view text) {
  const std::string log = daemon_->log();
  std::size_t count = 0;
  for (auto at = log.find(text); at != std::string::npos; at = log.find(text, at + text.size())) {
    ++count;
  }
  return count;
}

bool DaemonTest::logHasLineWith(std::initializer_list<std::string_view> parts) {
  std::istringstream lines(daemon_->log());
  for (std::string line; std::getline(lines, line);) {
    bool all = true;
    for (std::string_view part : parts) all = all && line.find(part) != std::string::npos;
    if (all) return true;
  }
  return false;
}
