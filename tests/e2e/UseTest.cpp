// Using plug-ins through the real daemon: enabling them for a host (read back from the service
// launcher's table), read access to their bundles, and holds that keep them from hosts.

#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <map>
#include <set>
#include <string>
#include <vector>

#include "Annexa/AXPlugInInterface.h"
#include "Annexa/AXPlugInLauncher.h"
#include "Annexa/AXProtocol.h"
#include "platform/launcher/ServiceLauncher.h"
#include "platform/registrum/Workspace.h"
#include "platform/runtime/Runtime.h"
#include "platform/sandbox/Sandbox.h"
#include "tests/e2e/Bundles.h"
#include "tests/e2e/DaemonTest.h"
#include "tests/support/BlockingClient.h"

namespace {

using bundles::PlugInContents;
using launcher::ServiceLauncher;
using value::Dictionary;
using value::Uuid;
using value::Value;

const std::string kKeyboard = AXD_VENDOR_PREFIX ".keyboard-service";
const std::string kKeyboardNetwork = AXD_VENDOR_PREFIX ".consent.keyboard-network";
const std::string kSleep = "/bin/sleep";

Dictionary point(const std::string& name) {
  return {{"QSExtensionPointIdentifier", Value::string(name)}};
}

class UseTest : public DaemonTest {
 protected:
  void TearDown() override { stopPrograms(); }

  // Starts the daemon (verbose, so that refusals are logged) with |environment|.
  void boot(const std::map<std::string, std::string>& environment = {}) {
    client_.reset();
    registry_.reset();
    ASSERT_TRUE(start({"-v"}, "", environment));
    root_ = std::filesystem::canonical(daemon().root());
    registry_ = registrum::Workspace::open(root_).value();
    client_ = std::make_unique<BlockingClient>();
  }

  // Writes the plug-in into "<root>/Applications/<app>.app" and registers it through the daemon
  // (so with a data container); its executable is a copy of sleep unless its manifest names one.
  // Returns its path.
  std::string install(const std::string& app, PlugInContents contents) {
    std::string home = root_ + "/Applications/" + app + ".app";
    bundles::writePlist(home + "/Info.plist",
                        Value::dictionary({{"QFBundleIdentifier", Value::string("app." + app)}}));
    if (!contents.info.find("QFBundleExecutable")) contents.executable = kSleep;
    std::string path = bundles::writePlugIn(home + "/PlugIns/" + contents.id + ".appex", contents);
    EXPECT_EQ(client_->outcome(client_->client().request(AXProtocol::kAdd, {path})), "ok");
    return path;
  }
  std::shared_ptr<const registrum::PlugInRecord> record(const std::string& path) {
    return registry_->plugInAtPath(path).value();
  }
  Uuid uuid(const std::string& path) { return record(path)->uuid(); }

  std::string send(const char* type, const std::vector<Uuid>& uuids) {
    return client_->outcome(client_->client().request(type, uuids, 0));
  }
  std::string lock(std::uint64_t flags, const std::vector<std::string>& paths) {
    auto request = client_->client().request(AXProtocol::kLock, paths);
    request[AXProtocol::kFlags] = Value::unsignedInteger(flags);
    return client_->outcome(request);
  }
  // The fields of a successful or failed reply; empty, with a failure recorded, for no reply.
  Dictionary reply(BlockingClient& client, const AXDaemonClient::Request& request) {
    auto pending = client.start(request);
    std::optional<zyn::ReplyOrError> answer = BlockingClient::await(pending);
    const Value* body = answer ? std::get_if<Value>(&*answer) : nullptr;
    if (body && body->asDictionary()) return *body->asDictionary();
    ADD_FAILURE() << BlockingClient::describe(answer);
    return {};
  }
  // The token of a hold that |client| placed on the plug-in at |path|.
  Uuid hold(BlockingClient& client, const std::string& path) {
    auto request = client.client().request(AXProtocol::kLock, {path});
    request[AXProtocol::kFlags] = Value::unsignedInteger(AXProtocol::kHoldPlugIns);
    Dictionary fields = reply(client, request);
    const Value* token = fields.find(AXProtocol::kUuids);
    EXPECT_TRUE(token && token->asUuid()) << Value::dictionary(fields).description();
    return token && token->asUuid() ? *token->asUuid() : Uuid();
  }

  // The forms that a match request returns to this program, by identifier.
  std::map<std::string, Dictionary> discovered() {
    auto request = client_->client().request(AXProtocol::kMatch);
    request[AXProtocol::kFlags] = Value::unsignedInteger(0);
    Dictionary fields = reply(*client_, request);
    const Value* matches = fields.find(AXProtocol::kMatches);
    std::optional<Value> forms =
        matches ? client_->client().convertFromZyn(*matches) : std::nullopt;
    std::map<std::string, Dictionary> found;
    for (const Value& form : forms && forms->asArray() ? *forms->asArray() : value::Array()) {
      found[*form.asDictionary()->find("identifier")->asString()] = *form.asDictionary();
    }
    return found;
  }
  // The identifiers that a match request returns to this program.
  std::set<std::string> visible() {
    std::set<std::string> ids;
    for (const auto& [id, form] : discovered()) ids.insert(id);
    return ids;
  }
  // The launcher's services, by bundle identifier.
  std::map<std::string, ServiceLauncher::Service> services() {
    std::map<std::string, ServiceLauncher::Service> found;
    std::vector<ServiceLauncher::Service> listed = ServiceLauncher::services().value();
    for (ServiceLauncher::Service& service : listed) {
      found[service.bundleIdentifier] = std::move(service);
    }
    return found;
  }
  static Dictionary environmentOf(const ServiceLauncher::Service& service) {
    const Value* settings = service.description.find("ZynService");
    settings = settings && settings->asDictionary()
                   ? settings->asDictionary()->find("EnvironmentVariables")
                   : nullptr;
    return settings && settings->asDictionary() ? *settings->asDictionary() : Dictionary();
  }
  std::set<std::string> enabled() {
    std::set<std::string> ids;
    for (const auto& [id, service] : services()) ids.insert(id);
    return ids;
  }

  // Runs the copy of sleep at |program| until stopPrograms() or the end of the test.
  void run(const std::string& program) {
    pid_t child = 0;
    char* argv[] = {const_cast<char*>(program.c_str()), const_cast<char*>("60"), nullptr};
    ASSERT_EQ(posix_spawn(&child, program.c_str(), nullptr, nullptr, argv, environ), 0);
    children_.push_back(child);
  }
  void stopPrograms() {
    for (pid_t child : children_) {
      kill(child, SIGKILL);
      waitpid(child, nullptr, 0);
    }
    children_.clear();
  }

  std::string root_;
  std::shared_ptr<registrum::Workspace> registry_;
  std::unique_ptr<BlockingClient> client_;
  std::vector<pid_t> children_;
};

TEST_F(UseTest, EnablingRegistersTheServiceDescriptionWithTheLauncher) {
  boot({{"AXTEST_SDK", "sdk-e2e"}});
  bundles::writePlist(
      root_ + "/var/db/consent.plist",
      Value::dictionary(
          {{"app.Granted",
            Value::array({Value::dictionary({{"Service", Value::string(kKeyboardNetwork)},
                                             {"Granted", Value::boolean(true)}})})},
           {"app.Refused",
            Value::array({Value::dictionary({{"Service", Value::string(kKeyboardNetwork)},
                                             {"Granted", Value::boolean(false)}}),
                          Value::dictionary({{"Service", Value::string("other.service")},
                                             {"Granted", Value::boolean(true)}})})}}));
  const Dictionary openAccess = {{"RequestsOpenAccess", Value::boolean(true)}};
  const Dictionary manifest = {
      {"Label", Value::string("kept")},
      {"_SandboxProfile", Value::string("unconfined")},
      {"_OmitSandboxParameters", Value::boolean(false)},
      {"EnvironmentVariables", Value::dictionary({{"TMPDIR", Value::string("/elsewhere")},
                                                  {"LANG", Value::string("C")},
                                                  {"AXTEST_SDK", Value::string("own")}})}};
  struct Row {
    std::string app;
    PlugInContents contents;
    std::string profile;
  };
  const std::vector<Row> rows = {
      {"Granted", {.id = "kb.closed", .extension = point(kKeyboard)}, "keyboard"},
      {"Granted",
       {.id = "kb.open", .attributes = openAccess, .extension = point(kKeyboard)},
       "plugin"},
      {"Granted",
       {.id = "kb.one",
        .attributes = {{"RequestsOpenAccess", Value::integer(1)}},
        .extension = point(kKeyboard)},
       "plugin"},
      {"Refused",
       {.id = "kb.refused", .attributes = openAccess, .extension = point(kKeyboard)},
       "keyboard"},
      {"Other",
       {.id = "filter", .extension = point(AXD_VENDOR_PREFIX ".netfence.filter-data")},
       "network-filter"},
      {"Other",
       {.id = "glance", .extension = point(AXD_VENDOR_PREFIX ".glance.extension.preview")},
       "glanced"},
      {"Other",
       {.id = "manifest",
        .info = {{"ZynService", Value::dictionary(manifest)},
                 {"QFBundlePackageType", Value::string("BNDL")}}},
       "plugin"},
  };
  std::vector<Uuid> uuids;
  std::map<std::string, std::string> paths;
  for (const Row& row : rows) {
    paths[row.contents.id] = install(row.app, row.contents);
    uuids.push_back(uuid(paths[row.contents.id]));
  }
  ASSERT_EQ(send(AXProtocol::kReady, uuids), "ok");

  std::map<std::string, ServiceLauncher::Service> table = services();
  ASSERT_EQ(table.size(), rows.size());
  for (const Row& row : rows) {
    const std::string& id = row.contents.id;
    const ServiceLauncher::Service& service = table[id];
    EXPECT_EQ(service.host, getpid()) << id;
    EXPECT_EQ(service.version, "1.0") << id;
    EXPECT_EQ(service.executablePath, paths[id] + "/sleep") << id;
    std::string container = record(paths[id])->dataContainerPath().value();
    Dictionary environment{{"HOME", Value::string(container)},
                           {"QFFIXED_USER_HOME", Value::string(container)},
                           {"TMPDIR", Value::string(container + "/tmp")},
                           {"AXTEST_SDK", Value::string("sdk-e2e")}};
    const Value* declared = row.contents.info.find("ZynService");
    Dictionary own = declared ? *declared->asDictionary() : Dictionary();
    if (const Value* variables = own.find("EnvironmentVariables")) {
      for (const auto& [name, setting] : *variables->asDictionary()) {
        environment = environment.with(name, setting);
      }
    }
    Dictionary expected = own.with("EnvironmentVariables", Value::dictionary(environment))
                              .with("_SandboxProfile", Value::string(row.profile))
                              .with("_OmitSandboxParameters", Value::boolean(true));
    EXPECT_EQ(service.description, Dictionary({{"ZynService", Value::dictionary(expected)},
                                               {"QFBundlePackageType", Value::string("ZYN!")}}))
        << id << ": " << Value::dictionary(service.description).description();
  }
}

TEST_F(UseTest, ReadyChecksEveryPlugInBeforeEnablingAny) {
  boot();
  Uuid first = uuid(install("Host", {.id = "ready.first"}));
  Uuid second = uuid(install("Host", {.id = "ready.second"}));
  std::string heldPath = install("Host", {.id = "ready.held"});
  Uuid held = uuid(heldPath);
  Uuid guarded =
      uuid(install("Host", {.id = "ready.guarded",
                            .extension = {{"QSExtensionHostEntitlement", Value::string("x")}}}));
  Uuid data =
      uuid(install("Host", {.id = "ready.data",
                            .extension = {{"QSExtensionProtocol", Value::string("#Data")}}}));
  Uuid missing = uuid(install(
      "Host", {.id = "ready.missing", .info = {{"QFBundleExecutable", Value::string("gone")}}}));
  hold(*client_, heldPath);

  struct Row {
    std::vector<Uuid> uuids;
    std::string outcome;
    std::set<std::string> enabled;  // the whole table afterwards
  };
  const std::vector<Row> rows = {
      {{}, "ok", {}},
      {{first, held}, "11: access to plugin ready.held denied: the plug-in is on hold", {}},
      {{first, guarded},
       "11: access to plugin ready.guarded denied: the host does not have the \"x\" entitlement",
       {}},
      {{data}, "ok", {}},
      {{first, first, data}, "ok", {"ready.first"}},
      // A plug-in that cannot be enabled does not keep the others from it, and is reported.
      {{first, missing, second},
       "4: cannot obtain executable path for plug-in ready.missing(" + missing.string() + ")",
       {"ready.first", "ready.second"}},
  };
  for (const Row& row : rows) {
    EXPECT_EQ(send(AXProtocol::kReady, row.uuids), row.outcome);
    EXPECT_EQ(enabled(), row.enabled) << row.outcome;
  }
  const std::string enabling = "enabling pid=" + std::to_string(getpid()) + " for plug-in ";
  EXPECT_EQ(logCount(enabling + "ready.first("), 2u);  // once per request that got to enabling
  EXPECT_EQ(logCount(enabling + "ready.data("), 0u);
  EXPECT_TRUE(logHasLineWith(
      {"denied access to pid " + std::to_string(getpid()) + " for plugin ready.held(",
       "): the plug-in is on hold"}));
  EXPECT_FALSE(environmentOf(services()["ready.first"]).find("AXTEST_SDK"));
}

TEST_F(UseTest, AccessIssuesOneReadTokenPerPlugInInOrder) {
  boot();
  std::string one = install("Host", {.id = "access.one"});
  std::string two = install("Host", {.id = "access.two"});
  auto token = [](const std::string& path) {
    return Value::string(
        sandbox::Sandbox::issueFileExtension(sandbox::kReadExtensionClass, path, true).value());
  };
  for (const auto& order : {std::vector{one, two}, std::vector{two, one}}) {
    Dictionary fields =
        reply(*client_,
              client_->client().request(AXProtocol::kAccess, {uuid(order[0]), uuid(order[1])}, 0));
    EXPECT_EQ(
        fields,
        Dictionary({{AXProtocol::kExtensions, Value::array({token(order[0]), token(order[1])})}}));
  }
  EXPECT_EQ(send(AXProtocol::kAccess, {uuid(one), Uuid::random()}),
            "4: no such plugin (uuid not found)");
}

TEST_F(UseTest, AHoldIsRefusedForABusyApplicationAndLastsUntilReleased) {
  boot();
  std::string app = root_ + "/Applications/Busy.app";
  std::string busy = install("Busy", {.id = "busy.running"});
  install("Busy", {.id = "busy.idle"});
  const std::set<std::string> all = {"busy.idle", "busy.running"};
  run(busy + "/sleep");

  AXDaemonClient::Request request = client_->client().request(AXProtocol::kLock, {app});
  request[AXProtocol::kFlags] = Value::unsignedInteger(AXProtocol::kHoldApplications);
  EXPECT_EQ(reply(*client_, request),
            Dictionary({{AXProtocol::kErrorCode, Value::integer(14)},
                        {AXProtocol::kError, Value::string("plug-ins are busy")},
                        {AXProtocol::kConflicts,
                         Value::array({Value::dictionary(
                             {{"ExtensionBundleIdentifier", Value::string("busy.running")}})})}}));
  EXPECT_EQ(visible(), all);

  // Holding one bundle does not ask whether it runs.
  Uuid token = hold(*client_, busy);
  EXPECT_EQ(visible(), std::set<std::string>{"busy.idle"});
  auto release = [&](value::Array tokens, bool withPaths) {
    auto request = client_->client().request(AXProtocol::kLock, {app});
    if (!withPaths) request.erase(AXProtocol::kPaths);
    request[AXProtocol::kUuids] = Value::array(std::move(tokens));
    return client_->outcome(request);
  };
  EXPECT_EQ(release({Value::uuid(Uuid::random())}, false), "ok");
  EXPECT_EQ(release({Value::string("junk")}, false), "ok");
  EXPECT_EQ(visible(), std::set<std::string>{"busy.idle"});
  EXPECT_EQ(release({Value::uuid(token)}, true), "ok");
  EXPECT_EQ(visible(), all);

  // A hold also ends with the connection of the client that placed it.
  auto other = std::make_unique<BlockingClient>();
  token = hold(*other, busy);
  EXPECT_EQ(visible(), std::set<std::string>{"busy.idle"});
  other.reset();
  EXPECT_TRUE(daemon().waitForLog("releasing plug-in hold " + token.string() + " for dead client"));
  EXPECT_EQ(visible(), all);

  // Once nothing runs, a hold on the application covers all its plug-ins.
  stopPrograms();
  EXPECT_EQ(lock(AXProtocol::kHoldApplications, {app}).rfind("ok {", 0), 0u);
  EXPECT_EQ(visible(), std::set<std::string>{});
}

TEST_F(UseTest, HoldRequestsNamingNoPlugInFailOrHoldNothing) {
  boot();
  std::string app = root_ + "/Applications/Host.app";
  install("Host", {.id = "lock.plain"});
  const std::string nowhere = root_ + "/nowhere.appex";
  EXPECT_EQ(lock(3, {nowhere, app}), "9: invalid path: " + nowhere);
  EXPECT_EQ(lock(3, {app}), "4: invalid request format (unsupported hold flags)");
  EXPECT_EQ(lock(0, {app}), "4: invalid request format (unsupported hold flags)");
  EXPECT_EQ(lock(AXProtocol::kHoldPlugIns, {app}), "9: no plug-in at path:" + app);
  EXPECT_EQ(lock(AXProtocol::kHoldPlugIns, {}).rfind("ok {", 0), 0u);
  EXPECT_EQ(lock(3, {}).rfind("ok {", 0), 0u);
  EXPECT_EQ(visible(), std::set<std::string>{"lock.plain"});
  expectServing();
}

TEST_F(UseTest, APlugInMadeReadyStartsWithTheDescribedEnvironmentAndOnlyThen) {
  boot();
  Dictionary zyn{{"EnvironmentVariables", Value::dictionary({{"LANG", Value::string("C")}})}};
  std::string path = install("Launch", {.id = "launch.env",
                                        .info = {{"QFBundleExecutable", Value::string("report")},
                                                 {"ZynService", Value::dictionary(zyn)}}});
  {
    std::ofstream script(path + "/report");
    script << "#!/bin/sh\nenv > \"$HOME/env.out\"\n";
  }
  std::filesystem::permissions(path + "/report", std::filesystem::perms(0755));
  Dictionary form{{"bundleInfo", Value::dictionary({
                                     {"QFBundleIdentifier", Value::string("launch.env")},
                                     {"QFBundleShortVersionString", Value::string("1.0")},
                                 })}};
  setenv("AXTEST_HOST_ONLY", "1", 1);

  os::Result<pid_t> refused = AXPlugInLauncher::launch(form);
  ASSERT_FALSE(refused.ok());
  EXPECT_EQ(refused.error().errnum, EPERM);

  ASSERT_EQ(send(AXProtocol::kReady, {uuid(path)}), "ok");
  os::Result<pid_t> started = AXPlugInLauncher::launch(form);
  ASSERT_TRUE(started.ok()) << started.error().message;
  int status = 0;
  ASSERT_EQ(waitpid(started.value(), &status, 0), started.value());
  EXPECT_EQ(status, 0);

  std::string container = record(path)->dataContainerPath().value();
  std::ifstream written(container + "/env.out");
  std::set<std::string> lines;
  for (std::string line; std::getline(written, line);) lines.insert(line);
  for (const std::string& expected : {"HOME=" + container, "QFFIXED_USER_HOME=" + container,
                                      "TMPDIR=" + container + "/tmp", std::string("LANG=C")}) {
    EXPECT_TRUE(lines.contains(expected)) << expected;
  }
  for (const std::string& line : lines) EXPECT_FALSE(line.starts_with("AXTEST_HOST_ONLY=")) << line;
  unsetenv("AXTEST_HOST_ONLY");

  // axctl launch: ready for its own process, start, and the plug-in's exit status as its own.
  Subprocess::Outcome launched = axctl({"launch", uuid(path).string()});
  EXPECT_EQ(launched.status, 0) << launched.err;
}

TEST_F(UseTest, AHostBuildsTheInterfaceOfTheProtocolThatADiscoveredPlugInNames) {
  boot();
  runtime::Runtime::shared().addProtocol("e2e.Talking", {}, {"talk:"});
  runtime::Runtime::shared().addProtocol("e2e.Cancelling", {}, {"cancel"});
  Value compound = Value::array({Value::string("e2e.Talking"), Value::string("e2e.Cancelling")});
  install("Tools", {.id = "talker", .extension = {{"QSExtensionProtocol", compound}}});
  install("Tools", {.id = "data", .extension = {{"QSExtensionProtocol", Value::string("#Data")}}});
  std::map<std::string, Dictionary> forms = discovered();
  ASSERT_EQ(forms.size(), 2u);

  std::optional<AXError> error;
  auto interface =
      AXPlugInInterface::make(forms["talker"], {{"talk:", "request:0:{String}"}}, &error);
  ASSERT_TRUE(interface) << error->description();
  EXPECT_EQ(interface->protocol()->name(), "__XX_COMPOUND__e2e.Talking__e2e.Cancelling");
  EXPECT_TRUE(interface->checkArguments("talk:", false, {Value::string("hi")}).ok());
  EXPECT_FALSE(interface->checkArguments("talk:", false, {Value::integer(1)}).ok());

  EXPECT_EQ(AXPlugInInterface::make(forms["data"], {}, &error), nullptr);
  EXPECT_EQ(error->code(), 12);
}

}  // namespace
