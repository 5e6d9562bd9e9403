// Using plug-ins through the real daemon: enabling them for a host (read back from the service
// launcher's table) and starting them, read access to their bundles, holds that keep them from
// hosts, and the interface a host builds from a discovered plug-in.

#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <map>
#include <set>
#include <string>
#include <vector>

#include "Annexa/AXPlugInInterface.h"
#include "Annexa/AXProtocol.h"
#include "platform/launcher/ServiceLauncher.h"
#include "platform/runtime/Runtime.h"
#include "platform/sandbox/Sandbox.h"
#include "tests/e2e/Bundles.h"
#include "tests/e2e/DaemonTest.h"
#include "tests/platform/ScopedEnvironment.h"

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
  void TearDown() override { stopProgram(); }

  // Writes the plug-in into "<root>/Applications/<app>.app" and registers it through the daemon
  // (so with a data container); its executable is a copy of sleep unless its manifest names one.
  // Returns its path.
  std::string install(const std::string& app, PlugInContents contents) {
    if (!contents.info.find("QFBundleExecutable")) contents.executable = kSleep;
    std::string path = bundles::plugIn(root() + "/Applications", app, contents);
    EXPECT_EQ(send(AXProtocol::kAdd, {path}), "ok");
    return path;
  }
  std::string lock(std::uint64_t flags, const std::vector<std::string>& paths) {
    auto request = client().client().request(AXProtocol::kLock, paths);
    request[AXProtocol::kFlags] = Value::unsignedInteger(flags);
    return client().outcome(request);
  }
  // The token of a hold that client() placed on the plug-in at |path|.
  Uuid hold(const std::string& path) {
    auto request = client().client().request(AXProtocol::kLock, {path});
    request[AXProtocol::kFlags] = Value::unsignedInteger(AXProtocol::kHoldPlugIns);
    Dictionary fields = reply(client(), request);
    const Value* token = fields.find(AXProtocol::kUuids);
    EXPECT_TRUE(token && token->asUuid()) << Value::dictionary(fields).description();
    return token && token->asUuid() ? *token->asUuid() : Uuid();
  }
  // The identifiers of the plug-ins that the launcher's table lists.
  std::set<std::string> enabled() {
    std::set<std::string> ids;
    std::vector<ServiceLauncher::Service> listed = ServiceLauncher::services().value();
    for (const auto& service : listed) ids.insert(service.bundleIdentifier);
    return ids;
  }

  // Runs the copy of sleep at |program| until stopProgram() or the end of the test.
  void run(const std::string& program) {
    char* argv[] = {const_cast<char*>(program.c_str()), const_cast<char*>("60"), nullptr};
    ASSERT_EQ(posix_spawn(&running_, program.c_str(), nullptr, nullptr, argv, environ), 0);
  }
  void stopProgram() {
    if (running_ > 0 && kill(running_, SIGKILL) == 0) waitpid(running_, nullptr, 0);
    running_ = 0;
  }

  pid_t running_ = 0;
};

TEST_F(UseTest, EnablingRegistersTheServiceDescriptionWithTheLauncher) {
  ASSERT_TRUE(start({}, "", {{"AXTEST_SDK", "sdk-e2e"}}));
  auto consent = [](const std::string& service, bool granted) {
    return Value::dictionary(
        {{"Service", Value::string(service)}, {"Granted", Value::boolean(granted)}});
  };
  bundles::writePlist(
      root() + "/var/db/consent.plist",
      Value::dictionary({{"app.Granted", Value::array({consent(kKeyboardNetwork, true)})},
                         {"app.Refused", Value::array({consent(kKeyboardNetwork, false),
                                                       consent("other.service", true)})}}));
  const Dictionary openAccess = {{"RequestsOpenAccess", Value::boolean(true)}};
  const Dictionary manifest = {
      {"Label", Value::string("kept")},
      {"_SandboxProfile", Value::string("unconfined")},
      {"_OmitSandboxParameters", Value::boolean(false)},
      {"EnvironmentVariables",
       Value::dictionary({{"LANG", Value::string("C")}, {"AXTEST_SDK", Value::string("own")}})}};
  auto keyboard = [](const char* id, const Dictionary& attributes) {
    return PlugInContents{.id = id, .attributes = attributes, .extension = point(kKeyboard)};
  };
  struct Row {
    std::string app;
    PlugInContents contents;
    std::string profile;
  };
  const std::vector<Row> rows = {
      {"Granted", keyboard("kb.closed", {}), "keyboard"},
      {"Granted", keyboard("kb.open", openAccess), "plugin"},
      {"Granted", keyboard("kb.one", {{"RequestsOpenAccess", Value::integer(1)}}), "plugin"},
      {"Refused", keyboard("kb.refused", openAccess), "keyboard"},
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
  for (const Row& row : rows) uuids.push_back(uuid(install(row.app, row.contents)));
  ASSERT_EQ(send(AXProtocol::kReady, uuids), "ok");

  std::map<std::string, ServiceLauncher::Service> table;
  std::vector<ServiceLauncher::Service> listed = ServiceLauncher::services().value();
  for (const auto& service : listed) table[service.bundleIdentifier] = service;
  ASSERT_EQ(table.size(), rows.size());
  for (const Row& row : rows) {
    const Value* zyn = table[row.contents.id].description.find("ZynService");
    const Value* profile = zyn ? zyn->asDictionary()->find("_SandboxProfile") : nullptr;
    EXPECT_EQ(profile ? *profile : Value(), Value::string(row.profile)) << row.contents.id;
  }
  // The manifest's service with the daemon's variables under its own, and the daemon's sandbox.
  const ServiceLauncher::Service& service = table["manifest"];
  std::string path = root() + "/Applications/Other.app/PlugIns/manifest.appex";
  EXPECT_EQ(service.host, getpid());
  EXPECT_EQ(service.version, "1.0");
  EXPECT_EQ(service.executablePath, path + "/sleep");
  std::string container = record(path)->dataContainerPath().value();
  Dictionary environment{{"HOME", Value::string(container)},
                         {"QFFIXED_USER_HOME", Value::string(container)},
                         {"TMPDIR", Value::string(container + "/tmp")},
                         {"LANG", Value::string("C")},
                         {"AXTEST_SDK", Value::string("own")}};
  Dictionary expected = manifest.with("EnvironmentVariables", Value::dictionary(environment))
                            .with("_SandboxProfile", Value::string("plugin"))
                            .with("_OmitSandboxParameters", Value::boolean(true));
  EXPECT_EQ(service.description, Dictionary({{"ZynService", Value::dictionary(expected)},
                                             {"QFBundlePackageType", Value::string("ZYN!")}}))
      << Value::dictionary(service.description).description();
}

// An uninstall by another process takes the plug-in out of discovery and out of the launcher's
// table; its election comes back with it.
TEST_F(UseTest, AnUninstalledPlugInIsWithdrawnAndKeepsItsElection) {
  ASSERT_TRUE(start());
  std::string path = install("Gone", {.id = "gone.tool"});
  Uuid before = uuid(path);
  ASSERT_EQ(send(AXProtocol::kReady, {before}), "ok");
  auto annotate = client().client().request(AXProtocol::kAnnotate, {before}, 0);
  annotate[AXProtocol::kAnnotations] = Value::dictionary({{"election", Value::integer(7)}});
  ASSERT_EQ(client().outcome(annotate), "ok");
  ASSERT_EQ(enabled().count("gone.tool"), 1u);

  auto registry = registrum::Workspace::open(root());
  ASSERT_TRUE(registry.ok());
  ASSERT_TRUE(registry.value()->uninstallApplication(root() + "/Applications/Gone.app").ok());
  ASSERT_TRUE(daemon().waitForLog("UNINSTALLED:gone.tool gone.tool(1.0)"));
  // The withdrawal runs on the service queue, so a request served after it sees it done.
  EXPECT_EQ(client().bulk(0), "ok");
  EXPECT_EQ(enabled().count("gone.tool"), 0u);
  EXPECT_EQ(matchIds(), std::vector<std::string>{});

  ASSERT_EQ(send(AXProtocol::kAdd, {path}), "ok");
  EXPECT_EQ(matchIds(Value::dictionary({{"QSUserElection", Value::string("7")}})),
            std::vector<std::string>{"gone.tool"});
}

// The host policy is tested in-process; here, that ready applies it and holds, and enables only
// once every plug-in passed.
TEST_F(UseTest, ReadyChecksEveryPlugInBeforeEnablingAny) {
  ASSERT_TRUE(start());
  Uuid first = uuid(install("Host", {.id = "ready.first"}));
  Uuid second = uuid(install("Host", {.id = "ready.second"}));
  std::string heldPath = install("Host", {.id = "ready.held"});
  Uuid guarded =
      uuid(install("Host", {.id = "ready.guarded",
                            .extension = {{"QSExtensionHostEntitlement", Value::string("x")}}}));
  Uuid data =
      uuid(install("Host", {.id = "ready.data",
                            .extension = {{"QSExtensionProtocol", Value::string("#Data")}}}));
  Uuid missing = uuid(install(
      "Host", {.id = "ready.missing", .info = {{"QFBundleExecutable", Value::string("gone")}}}));
  hold(heldPath);

  struct Row {
    std::vector<Uuid> uuids;
    std::string outcome;
    std::set<std::string> enabled;  // the whole table afterwards
  };
  const std::vector<Row> rows = {
      {{first, uuid(heldPath)},
       "11: access to plugin ready.held denied: the plug-in is on hold",
       {}},
      {{first, guarded},
       "11: access to plugin ready.guarded denied: the host does not have the \"x\" entitlement",
       {}},
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
}

TEST_F(UseTest, AccessIssuesOneReadTokenPerPlugInInOrder) {
  ASSERT_TRUE(start());
  std::string one = install("Host", {.id = "access.one"});
  std::string two = install("Host", {.id = "access.two"});
  auto token = [](const std::string& path) {
    return Value::string(
        sandbox::Sandbox::issueFileExtension(sandbox::kReadExtensionClass, path, true).value());
  };
  Dictionary fields =
      reply(client(), client().client().request(AXProtocol::kAccess, {uuid(two), uuid(one)}, 0));
  EXPECT_EQ(fields,
            Dictionary({{AXProtocol::kExtensions, Value::array({token(two), token(one)})}}));
  EXPECT_EQ(send(AXProtocol::kAccess, {uuid(one), Uuid::random()}),
            "4: no such plugin (uuid not found)");
}

// An access for many plug-ins builds a large reply: one over the frame limit is answered with an
// error, and a request over the client's limit is not sent; the connection goes on after both.
TEST_F(UseTest, WhatWouldBeOverTheFrameLimitIsRefusedAndTheConnectionGoesOn) {
  ScopedEnvironment environment;
  environment.set("AXD_MAX_FRAME_BYTES", "16384");  // for the daemon and for this client
  ASSERT_TRUE(start());
  Uuid one = uuid(install("Host", {.id = "access.one"}));
  auto access = [&](std::size_t copies) {
    return send(AXProtocol::kAccess, std::vector<Uuid>(copies, one));
  };
  // A token is about 200 bytes; 20 UUIDs ask for about 400.
  EXPECT_TRUE(access(20).starts_with("ok {")) << access(20);
  std::string refused = access(200);
  EXPECT_TRUE(refused.starts_with("4: reply too large (")) << refused;
  EXPECT_TRUE(refused.ends_with(" bytes, limit 16384)")) << refused;
  EXPECT_EQ(logCount("not sending the reply to " + thisClient() + ": reply too large ("), 1u);
  refused = access(1000);
  EXPECT_TRUE(refused.starts_with("service error: request too large (")) << refused;
  EXPECT_TRUE(refused.ends_with(" bytes, limit 16384)")) << refused;
  EXPECT_EQ(client().bulk(0), "ok");
}

// Holds and their release are tested in-process; here, the lock request's paths, flags and
// tokens, the busy check against processes that run, and discovery leaving held plug-ins out.
TEST_F(UseTest, AHoldIsRefusedForABusyApplicationAndLastsUntilReleased) {
  ASSERT_TRUE(start());
  std::string app = root() + "/Applications/Busy.app";
  std::string busy = install("Busy", {.id = "busy.running"});
  install("Busy", {.id = "busy.idle"});
  const std::vector<std::string> all = {"busy.idle", "busy.running"};
  const std::string nowhere = root() + "/nowhere.appex";
  EXPECT_EQ(lock(AXProtocol::kHoldApplications, {nowhere}), "9: invalid path: " + nowhere);
  EXPECT_EQ(lock(3, {app}), "4: invalid request format (unsupported hold flags)");
  EXPECT_EQ(lock(AXProtocol::kHoldPlugIns, {app}), "9: no plug-in at path:" + app);
  EXPECT_EQ(lock(AXProtocol::kHoldPlugIns, {}).rfind("ok {", 0), 0u);
  EXPECT_EQ(matchIds(), all);
  run(busy + "/sleep");

  AXDaemonClient::Request request = client().client().request(AXProtocol::kLock, {app});
  request[AXProtocol::kFlags] = Value::unsignedInteger(AXProtocol::kHoldApplications);
  EXPECT_EQ(reply(client(), request),
            Dictionary({{AXProtocol::kErrorCode, Value::integer(14)},
                        {AXProtocol::kError, Value::string("plug-ins are busy")},
                        {AXProtocol::kConflicts,
                         Value::array({Value::dictionary(
                             {{"ExtensionBundleIdentifier", Value::string("busy.running")}})})}}));
  EXPECT_EQ(matchIds(), all);

  // Holding one bundle does not ask whether it runs.
  Uuid token = hold(busy);
  EXPECT_EQ(matchIds(), std::vector<std::string>{"busy.idle"});
  auto release = [&](const Value& tokens) {
    auto request = client().client().request(AXProtocol::kLock);
    request[AXProtocol::kUuids] = tokens;
    return client().outcome(request);
  };
  EXPECT_EQ(release(Value::array({Value::string("junk")})), "ok");
  EXPECT_EQ(matchIds(), std::vector<std::string>{"busy.idle"});
  EXPECT_EQ(release(Value::array({Value::uuid(token)})), "ok");
  EXPECT_EQ(matchIds(), all);

  // Once nothing runs, a hold on the application covers all its plug-ins.
  stopProgram();
  EXPECT_EQ(lock(AXProtocol::kHoldApplications, {app}).rfind("ok {", 0), 0u);
  EXPECT_EQ(matchIds(), std::vector<std::string>{});
}

// What the launcher gives a plug-in is tested in-process; here, that axctl launch has the daemon
// make a plug-in ready for axctl's process and starts it in the home that the daemon described.
TEST_F(UseTest, AxctlLaunchStartsAPlugInInItsContainer) {
  ASSERT_TRUE(start());
  std::string path = install(
      "Launch", {.id = "launch.env", .info = {{"QFBundleExecutable", Value::string("report")}}});
  std::ofstream(path + "/report") << "#!/bin/sh\ntouch \"$HOME/started\"\n";
  std::filesystem::permissions(path + "/report", std::filesystem::perms(0755));
  Subprocess::Outcome launched = axctl({"launch", uuid(path).string()});
  EXPECT_EQ(launched.status, 0) << launched.err;
  EXPECT_TRUE(std::filesystem::exists(record(path)->dataContainerPath().value() + "/started"));
}

TEST_F(UseTest, AHostBuildsTheInterfaceOfTheProtocolThatADiscoveredPlugInNames) {
  ASSERT_TRUE(start());
  runtime::Runtime::shared().addProtocol("e2e.Talking", {}, {"talk:"});
  runtime::Runtime::shared().addProtocol("e2e.Cancelling", {}, {"cancel"});
  Value compound = Value::array({Value::string("e2e.Talking"), Value::string("e2e.Cancelling")});
  install("Tools", {.id = "talker", .extension = {{"QSExtensionProtocol", compound}}});
  install("Tools", {.id = "data", .extension = {{"QSExtensionProtocol", Value::string("#Data")}}});
  std::map<std::string, Dictionary> forms;
  for (const Value& form : match()) {
    forms[*form.asDictionary()->find("identifier")->asString()] = *form.asDictionary();
  }
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
