#include "tests/e2e/DaemonTest.h"

#include <unistd.h>

#include <algorithm>
#include <filesystem>

#include "Annexa/AXProtocol.h"
#include "tests/e2e/Bundles.h"

using value::Value;

bool DaemonTest::start(const std::vector<std::string>& arguments, const std::string& serviceName,
                       const std::map<std::string, std::string>& environment) {
  client_.reset();
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
  root_ = std::filesystem::canonical(daemon_->root());
  return true;
}

bool DaemonTest::restart() {
  client_.reset();
  os::Status restarted = daemon_->restart(AXD_EXECUTABLE);
  if (!restarted.ok()) ADD_FAILURE() << "axd did not restart: " << restarted.error().message;
  return restarted.ok();
}

BlockingClient& DaemonTest::client() {
  if (!client_) {
    client_ =
        std::make_unique<BlockingClient>(serviceName_.empty() ? nullptr : serviceName_.c_str());
  }
  return *client_;
}

void DaemonTest::grant(const value::Dictionary& entitlements) {
  bundles::grantProgram(root_, "e2e_tests", "/proc/self/exe", entitlements);
  client_.reset();
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

std::string DaemonTest::send(const char* type, const std::vector<std::string>& paths) {
  return client().outcome(client().client().request(type, paths));
}

std::string DaemonTest::send(const char* type, const std::vector<value::Uuid>& uuids) {
  return client().outcome(client().client().request(type, uuids, 0));
}

std::shared_ptr<const registrum::PlugInRecord> DaemonTest::record(const std::string& path) {
  auto registry = registrum::Workspace::open(root_);
  if (!registry.ok()) return nullptr;
  auto found = registry.value()->plugInAtPath(path);
  return found.ok() ? found.value() : nullptr;
}

value::Uuid DaemonTest::uuid(const std::string& path) {
  auto found = record(path);
  EXPECT_TRUE(found) << "no record of " << path;
  return found ? found->uuid() : value::Uuid();
}

value::Dictionary DaemonTest::reply(BlockingClient& client,
                                    const AXDaemonClient::Request& request) {
  auto pending = client.start(request);
  std::optional<zyn::ReplyOrError> answer = BlockingClient::await(pending);
  const Value* body = answer ? std::get_if<Value>(&*answer) : nullptr;
  if (body && body->asDictionary()) return *body->asDictionary();
  ADD_FAILURE() << BlockingClient::describe(answer);
  return {};
}

value::Array DaemonTest::match(const std::optional<Value>& rules, std::uint64_t flags) {
  auto request = client().client().request(AXProtocol::kMatch);
  if (rules) request[AXProtocol::kRules] = *rules;
  request[AXProtocol::kFlags] = Value::unsignedInteger(flags);
  value::Dictionary fields = reply(client(), request);
  const Value* matches = fields.find(AXProtocol::kMatches);
  std::optional<Value> list = matches ? client().client().convertFromZyn(*matches) : std::nullopt;
  if (list && list->asArray()) return *list->asArray();
  ADD_FAILURE() << "no matches: " << Value::dictionary(fields).description();
  return {};
}

std::vector<std::string> DaemonTest::matchIds(const std::optional<Value>& rules,
                                              std::uint64_t flags) {
  std::vector<std::string> ids;
  for (const Value& form : match(rules, flags)) {
    ids.push_back(*form.asDictionary()->find("identifier")->asString());
  }
  std::sort(ids.begin(), ids.end());
  return ids;
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
