// Journeys through the real daemon, each from the point of view of one of its users: a host that
// discovers, readies and starts a plug-in; an installer that replaces an application's plug-ins
// under a hold; a user who elects and excludes. Each checks what that user relies on, end to end.

#include <sys/stat.h>
#include <sys/wait.h>

#include <filesystem>
#include <fstream>
#include <memory>
#include <string>
#include <vector>

#include "Annexa/AXPlugInLauncher.h"
#include "Annexa/AXProtocol.h"
#include "platform/prefs/Preferences.h"
#include "tests/e2e/Bundles.h"
#include "tests/e2e/DaemonTest.h"

namespace {

using bundles::PlugInContents;
using value::Dictionary;
using value::Uuid;
using value::Value;
using Ids = std::vector<std::string>;

const std::string kWidget = "org.journey.widget";
const std::string kShare = "org.journey.share";
const std::string kManager = AXD_VENDOR_PREFIX ".private.annexa.manager";
const std::string kAllowedPlugIns = AXD_VENDOR_PREFIX ".developer.annexa.allowedplugins";
const std::string kUserPrefs = AXD_VENDOR_PREFIX ".annexa.userprefs";

Value rule(const std::string& key, const std::string& pattern) {
  return Value::dictionary({{key, Value::string(pattern)}});
}

const Value& field(const Value& form, const char* key) {
  static const Value missing;
  const Value* found = form.asDictionary() ? form.asDictionary()->find(key) : nullptr;
  return found ? *found : missing;
}

std::string text(const Value& form, const char* key) {
  const std::string* found = field(form, key).asString();
  return found ? *found : std::string();
}

// The UUID value a request wants, from the text a form carries.
Uuid uuidOf(const Value& form) {
  return Uuid::parse(text(form, "uuid")).value_or(Uuid());
}

class JourneyTest : public DaemonTest {
 protected:
  void SetUp() override { ASSERT_TRUE(start()); }

  std::string apps() const { return root() + "/Applications"; }
  std::string inApp(const std::string& app, const PlugInContents& contents) {
    return bundles::plugIn(apps(), app, contents);
  }
  void add(const std::vector<std::string>& paths) {
    ASSERT_EQ(send(AXProtocol::kAdd, paths), "ok");
  }
  std::string lock(BlockingClient& by, std::uint64_t flags, const std::string& path) {
    auto request = by.client().request(AXProtocol::kLock, {path});
    request[AXProtocol::kFlags] = Value::unsignedInteger(flags);
    return by.outcome(request);
  }
};

// A widget written as plug-in authors often write them: named only by "QSExtensionIdentifier",
// no "QFBundleIdentifier" nor "QFBundleShortVersionString", its version a number. Its program
// reports where it could make a temporary file.
std::string writeBareWidget(const std::string& bundle) {
  Dictionary attributes{{"QSExtensionVersion", Value::integer(2)}};
  Dictionary extension{{"QSExtensionIdentifier", Value::string("org.journey.clock")},
                       {"QSExtensionPointIdentifier", Value::string(kWidget)},
                       {"QSExtensionProtocol", Value::string("org.journey.Showing")},
                       {"QSExtensionAttributes", Value::dictionary(attributes)}};
  bundles::writePlist(bundle + "/Info.plist",
                      Value::dictionary({{"QFBundleExecutable", Value::string("clock")},
                                         {"QSExtension", Value::dictionary(extension)}}));
  std::ofstream(bundle + "/clock")
      << "#!/bin/sh\nf=$(/usr/bin/mktemp) && echo \"$f\" >\"$HOME/started\"\n";
  std::filesystem::permissions(bundle + "/clock", std::filesystem::perms(0755));
  return bundle;
}

TEST_F(JourneyTest, AHostDiscoversItsExtensionPointReadiesAPlugInAndStartsIt) {
  std::string clock = writeBareWidget(apps() + "/Widgets.app/PlugIns/Clock.appex");
  bundles::writePlist(apps() + "/Widgets.app/Info.plist", Value::dictionary({}));
  add({clock,
       inApp("Widgets", {.id = "org.journey.weather",
                         .extension = {{"QSExtensionPointIdentifier", Value::string(kWidget)}}}),
       inApp("Notes", {.id = "org.journey.notes",
                       .extension = {{"QSExtensionPointIdentifier", Value::string(kShare)},
                                     {"QSExtensionHostEntitlement", Value::string("x")}}})});

  // Discovery by what the plug-in dictionary declares.
  EXPECT_EQ(matchIds(rule("QSExtensionPointIdentifier", kWidget)),
            (Ids{"org.journey.clock", "org.journey.weather"}));
  EXPECT_EQ(matchIds(rule("QSExtensionProtocol", "org.journey.Showing")), Ids{"org.journey.clock"});
  EXPECT_EQ(matchIds(Value::dictionary({{"QSExtensionHostEntitlement", Value::boolean(false)}})),
            (Ids{"org.journey.clock", "org.journey.weather"}));
  value::Array widgets = match(rule("QSExtensionIdentifier", "org.journey.clock"));
  ASSERT_EQ(widgets.size(), 1u);
  const Value& form = widgets[0];
  EXPECT_EQ(field(form, "version"), Value::string("2"));

  // Ready for this process, then started by it: HOME and TMPDIR are there and private.
  ASSERT_EQ(send(AXProtocol::kReady, {uuidOf(form)}), "ok");
  os::Result<pid_t> child = AXPlugInLauncher::launch(*form.asDictionary());
  ASSERT_TRUE(child.ok()) << child.error().message;
  int status = 0;
  ASSERT_EQ(waitpid(child.value(), &status, 0), child.value());
  EXPECT_EQ(status, 0);
  std::string container = record(clock)->dataContainerPath().value();
  std::ifstream started(container + "/started");
  std::string temporary;
  ASSERT_TRUE(std::getline(started, temporary)) << "the plug-in could not make a temporary file";
  EXPECT_EQ(temporary.rfind(container + "/tmp/", 0), 0u) << temporary;
  struct stat tmp {};
  ASSERT_EQ(stat((container + "/tmp").c_str(), &tmp), 0);
  EXPECT_EQ(tmp.st_mode & 07777, 0700u);

  // A host whose entitlement restricts it to its extension point sees just that point.
  grant({{kAllowedPlugIns, rule("QSExtensionPointIdentifier", kWidget)},
         {"x", Value::boolean(true)}});
  EXPECT_EQ(matchIds(), (Ids{"org.journey.clock", "org.journey.weather"}));
  grant({{"x", Value::boolean(true)}});
  EXPECT_EQ(matchIds(), (Ids{"org.journey.clock", "org.journey.notes", "org.journey.weather"}));
}

TEST_F(JourneyTest, AnInstallerReplacesAnApplicationsPlugInsUnderAHold) {
  grant({{kManager, Value::boolean(true)}});
  std::string app = apps() + "/Tools.app";
  std::string old = inApp("Tools", {.id = "org.journey.tool", .version = "1.0"});
  add({old});
  ASSERT_EQ(matchIds(), Ids{"org.journey.tool"});

  auto connection = std::make_unique<BlockingClient>();
  BlockingClient& installer = *connection;
  std::string held = lock(installer, AXProtocol::kHoldApplications, app);
  ASSERT_EQ(held.rfind("ok {", 0), 0u) << held;
  EXPECT_EQ(matchIds(), Ids{});

  // The new version goes in at a new path, as a new plug-in: the hold covers it too.
  ASSERT_EQ(installer.outcome(installer.client().request(AXProtocol::kRemove, {old})), "ok");
  std::filesystem::remove_all(old);
  std::string fresh = bundles::writePlugIn(
      app + "/PlugIns/Tool-2.appex",
      {.id = "org.journey.tool", .version = "2.0", .executable = "/bin/sleep"});
  ASSERT_EQ(installer.outcome(installer.client().request(AXProtocol::kAdd, {fresh})), "ok");
  EXPECT_EQ(matchIds(), Ids{});
  EXPECT_EQ(send(AXProtocol::kReady, {uuid(fresh)}),
            "11: access to plugin org.journey.tool denied: the plug-in is on hold");
  // A plug-in in a sibling directory whose name starts like the held one is not held.
  std::string sibling = inApp("Tools2", {.id = "org.journey.sibling"});
  add({sibling});
  EXPECT_EQ(matchIds(), Ids{"org.journey.sibling"});

  // The installer's connection ends: its hold ends with it, and hosts see the new version only.
  connection.reset();
  ASSERT_TRUE(daemon().waitForLog("releasing plug-in hold"));
  value::Array forms =
      match(rule("QSExtensionIdentifier", "org.journey.tool"), AXProtocol::kDiscoverAllVersions);
  ASSERT_EQ(forms.size(), 1u);
  EXPECT_EQ(field(forms[0], "version"), Value::string("2.0"));
  EXPECT_EQ(send(AXProtocol::kReady, {uuidOf(forms[0])}), "ok");
}

TEST_F(JourneyTest, AUsersElectionAndExclusionShowAtTheNextDiscovery) {
  std::string clock =
      inApp("Widgets", {.id = "org.journey.clock",
                        .extension = {{"QSExtensionPointIdentifier", Value::string(kWidget)}}});
  add({clock,
       inApp("Notes", {.id = "org.journey.notes",
                       .extension = {{"QSExtensionPointIdentifier", Value::string(kShare)}}})});
  ASSERT_EQ(matchIds(rule("QSUserElection", "1")), Ids{});

  auto annotate = client().client().request(AXProtocol::kAnnotate);
  AXDaemonClient::set(annotate, {uuid(clock)});
  annotate[AXProtocol::kAnnotations] = Value::dictionary({{"election", Value::integer(1)}});
  ASSERT_EQ(client().outcome(annotate), "ok");
  EXPECT_EQ(matchIds(rule("QSUserElection", "1")), Ids{"org.journey.clock"});

  // Excluding an extension point hides its plug-ins from every host, elected or not.
  Value exclusions = Value::array({rule("QSExtensionPointIdentifier", kWidget)});
  ASSERT_TRUE(prefs::Preferences::setValue("exclusions", exclusions, kUserPrefs).ok());
  EXPECT_EQ(matchIds(), Ids{"org.journey.notes"});
  ASSERT_TRUE(prefs::Preferences::setValue("exclusions", std::nullopt, kUserPrefs).ok());
  value::Array forms = match(rule("QSExtensionIdentifier", "org.journey.clock"));
  ASSERT_EQ(forms.size(), 1u);
  EXPECT_EQ(field(forms[0], "annotations"), Value::dictionary({{"election", Value::integer(1)}}));
}

}  // namespace
