// Discovery through the real daemon: which plug-ins a match request returns to which client, how
// records of one identifier collapse, and what each returned form carries.

#include <fcntl.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <map>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "Annexa/AXProtocol.h"
#include "platform/prefs/Preferences.h"
#include "tests/e2e/Bundles.h"
#include "tests/e2e/DaemonTest.h"
#include "tests/platform/TempDirectory.h"
#include "tests/support/BlockingClient.h"

namespace {

using bundles::PlugInContents;
using value::Dictionary;
using value::Value;

const std::string kManager = AXD_VENDOR_PREFIX ".private.annexa.manager";
const std::string kAllowedPlugIns = AXD_VENDOR_PREFIX ".developer.annexa.allowedplugins";
const std::string kReplacePlugIn = AXD_VENDOR_PREFIX ".developer.replace-plugin";
const std::string kUserPrefs = AXD_VENDOR_PREFIX ".annexa.userprefs";
const std::string kUnauthorized = "11: unauthorized discovery flag (AXDiscoverAll)";
constexpr std::uint64_t kAll = AXProtocol::AXDiscoverAll;
// The exit status of a child that could not put itself under a seccomp filter.
constexpr int kNoSeccomp = 125;

std::string text(const Dictionary& form, const char* key) {
  const Value* field = form.find(key);
  return field && field->asString() ? *field->asString() : std::string();
}

// The identifiers of |forms|, sorted: most cases care which plug-ins come back, not in what order.
std::vector<std::string> identifiers(const value::Array& forms) {
  std::vector<std::string> ids;
  for (const Value& form : forms) ids.push_back(text(*form.asDictionary(), "identifier"));
  std::sort(ids.begin(), ids.end());
  return ids;
}

// The forms of |forms| by identifier; the last one wins when an identifier repeats.
std::map<std::string, Dictionary> byIdentifier(const value::Array& forms) {
  std::map<std::string, Dictionary> found;
  for (const Value& form : forms)
    found[text(*form.asDictionary(), "identifier")] = *form.asDictionary();
  return found;
}

std::string contentsOf(const std::string& path) {
  std::ifstream file(path);
  std::stringstream contents;
  contents << file.rdbuf();
  return contents.str();
}

// True when the table that "axctl match" prints lists |id|.
bool lists(const std::string& table, const std::string& id) {
  std::istringstream lines(table);
  for (std::string line; std::getline(lines, line);) {
    if (line.rfind(id + " ", 0) == 0) return true;
  }
  return false;
}

// Runs axctl with |arguments| as a sandboxed host runs: under a seccomp filter that allows every
// call, installed before exec (no_new_privs keeps it across exec). Status kNoSeccomp: the kernel
// refused the filter.
Subprocess::Outcome axctlUnderSeccomp(const std::vector<std::string>& arguments) {
  TempDirectory output;
  const std::string out = output / "out";
  const std::string err = output / "err";
  std::vector<std::string> words{AXCTL_EXECUTABLE};
  words.insert(words.end(), arguments.begin(), arguments.end());
  std::vector<char*> argv;
  for (std::string& word : words) argv.push_back(word.data());
  argv.push_back(nullptr);
  sock_filter allow = BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW);
  sock_fprog program{1, &allow};
  pid_t pid = fork();
  if (pid == 0) {
    // Only async-signal-safe calls between fork and exec: the parent has threads.
    dup2(open(out.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600), STDOUT_FILENO);
    dup2(open(err.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600), STDERR_FILENO);
    if (prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0 ||
        prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program) != 0) {
      _exit(kNoSeccomp);
    }
    execv(argv[0], argv.data());
    _exit(127);
  }
  Subprocess::Outcome outcome;
  const auto deadline = std::chrono::steady_clock::now() + Subprocess::kTimeout;
  int status = 0;
  while (pid > 0 && waitpid(pid, &status, WNOHANG) != pid) {
    if (std::chrono::steady_clock::now() >= deadline) {
      kill(pid, SIGKILL);
      waitpid(pid, &status, 0);
      return outcome;
    }
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  }
  if (pid > 0 && WIFEXITED(status)) outcome.status = WEXITSTATUS(status);
  outcome.out = contentsOf(out);
  outcome.err = contentsOf(err);
  return outcome;
}

// Waits until the wall clock enters a new second. A plug-in's "lastmodified" is the whole second
// of its registration, so registrations right after this share one and later ones get a greater.
void waitForNextSecond() {
  auto second = [] {
    return std::chrono::floor<std::chrono::seconds>(std::chrono::system_clock::now());
  };
  for (auto start = second(); second() == start;) {
    std::this_thread::sleep_for(std::chrono::milliseconds(5));
  }
}

class DiscoveryTest : public DaemonTest {
 protected:
  void SetUp() override {
    ASSERT_TRUE(start({"-v"}));  // the debug log names what was left out and why
    root_ = std::filesystem::canonical(daemon().root());
    client_ = std::make_unique<BlockingClient>();
  }

  // Grants this program |entitlements| and reconnects, since they are read at connection.
  void grant(const Dictionary& entitlements) {
    bundles::grantThisProgram(root_, entitlements);
    client_ = std::make_unique<BlockingClient>();
  }

  // A plug-in inside the application "<root>/<app>", made when missing; returns its path.
  std::string inApp(const std::string& app, const PlugInContents& contents) {
    if (!std::filesystem::exists(root_ + "/" + app + "/Info.plist")) {
      bundles::writePlist(root_ + "/" + app + "/Info.plist",
                          Value::dictionary({{"QFBundleIdentifier", Value::string(app)}}));
    }
    return bundles::writePlugIn(root_ + "/" + app + "/PlugIns/" + contents.id + ".appex", contents);
  }
  // A plug-in on the system volume, outside any application; returns its path.
  std::string onSystem(const PlugInContents& contents) {
    return bundles::writePlugIn(root_ + "/System/Library/PlugIns/" + contents.id + ".appex",
                                contents);
  }

  void add(const std::vector<std::string>& paths) {
    ASSERT_EQ(client_->outcome(client_->client().request(AXProtocol::kAdd, paths)), "ok");
  }

  AXDaemonClient::Request matchRequest(const std::optional<Value>& rules, std::uint64_t flags) {
    auto request = client_->client().request(AXProtocol::kMatch);
    if (rules) request[AXProtocol::kRules] = *rules;
    request[AXProtocol::kFlags] = Value::unsignedInteger(flags);
    return request;
  }
  // The forms that a match returns; a failed match is recorded and gives none.
  value::Array match(const std::optional<Value>& rules = std::nullopt, std::uint64_t flags = 0) {
    auto pending = client_->start(matchRequest(rules, flags));
    std::optional<zyn::ReplyOrError> reply = BlockingClient::await(pending);
    const Value* body = reply ? std::get_if<Value>(&*reply) : nullptr;
    const Dictionary* fields = body ? body->asDictionary() : nullptr;
    const Value* matches = fields ? fields->find(AXProtocol::kMatches) : nullptr;
    std::optional<Value> list = matches ? client_->client().convertFromZyn(*matches) : std::nullopt;
    if (!list || !list->asArray()) {
      ADD_FAILURE() << "no matches: " << BlockingClient::describe(reply);
      return {};
    }
    return *list->asArray();
  }
  std::vector<std::string> matchIds(const std::optional<Value>& rules = std::nullopt,
                                    std::uint64_t flags = 0) {
    return identifiers(match(rules, flags));
  }

  std::string root_;
  std::unique_ptr<BlockingClient> client_;
};

TEST_F(DiscoveryTest, RecordsOfOneIdentifierCollapseToTheHighestVersionThenThePreferredCopy) {
  struct Copy {
    std::string app;  // empty: on the system volume
    std::string version;
    bool late;  // registered a second after the others, so modified later
  };
  struct Row {
    std::string id;
    std::vector<Copy> copies;  // in path order, which is the order the registry lists them
    std::size_t survivor;
  };
  // Applications under "A" come before the system volume, those under "Z" after it.
  const std::vector<Row> rows = {
      {"ver.up", {{"A/One.app", "1.9", false}, {"A/Two.app", "1.10", false}}, 1},
      {"ver.down", {{"A/One.app", "1.10", false}, {"A/Two.app", "1.9", false}}, 0},
      // A system copy beats a non-system one, even one modified later.
      {"copy.system", {{"A/One.app", "1.0", true}, {"", "1.0", false}}, 1},
      // A non-system copy beats an earlier system copy only when modified later.
      {"copy.later", {{"", "1.0", false}, {"Z/Late.app", "1.0", true}}, 1},
      {"copy.same", {{"", "1.0", false}, {"Z/Late.app", "1.0", false}}, 0},
      {"copy.second", {{"A/One.app", "1.0", false}, {"A/Two.app", "1.0", true}}, 1},
      {"copy.tie", {{"A/One.app", "1.0", false}, {"A/Two.app", "1.0", false}}, 0},
      {"copy.first", {{"A/One.app", "1.0", true}, {"A/Two.app", "1.0", false}}, 0},
  };
  std::vector<std::string> early;
  std::vector<std::string> late;
  std::map<std::string, std::vector<std::string>> paths;  // by identifier, in path order
  for (const Row& row : rows) {
    for (const Copy& copy : row.copies) {
      PlugInContents contents{.id = row.id, .version = copy.version};
      std::string path = copy.app.empty() ? onSystem(contents) : inApp(copy.app, contents);
      (copy.late ? late : early).push_back(path);
      paths[row.id].push_back(path);
    }
  }
  waitForNextSecond();
  add(early);
  waitForNextSecond();
  add(late);

  auto returned = [&](std::uint64_t flags) {
    std::map<std::string, std::vector<std::string>> found;
    for (const Value& form : match(std::nullopt, flags)) {
      const Dictionary& fields = *form.asDictionary();
      found[text(fields, "identifier")].push_back(text(fields, "path"));
    }
    for (auto& [id, list] : found) std::sort(list.begin(), list.end());
    return found;
  };
  // The premise: every early copy shares one modification time, every late one a greater one.
  std::map<std::int64_t, std::vector<std::string>> byTime;
  for (const Value& form : match(std::nullopt, 0x1 | 0x4)) {
    const Dictionary& fields = *form.asDictionary();
    byTime[fields.find("lastmodified")->integerValue().value()].push_back(text(fields, "path"));
  }
  ASSERT_EQ(byTime.size(), 2u) << "the registrations did not fit in two seconds";
  ASSERT_EQ(byTime.begin()->second.size(), early.size());

  for (std::uint64_t flags : {0x0, 0x4, 0x1, 0x1 | 0x4}) {
    SCOPED_TRACE("flags " + std::to_string(flags));
    std::map<std::string, std::vector<std::string>> expected;
    for (const Row& row : rows) {
      bool versionsDiffer = row.copies[0].version != row.copies[1].version;
      bool keepAll = (flags == (0x1 | 0x4)) || (flags == 0x1 && versionsDiffer);
      expected[row.id] = keepAll ? paths[row.id] : std::vector{paths[row.id][row.survivor]};
      std::sort(expected[row.id].begin(), expected[row.id].end());
    }
    EXPECT_EQ(returned(flags), expected);
  }
}

TEST_F(DiscoveryTest, VisibilityFollowsTheClientsApplicationAndTheFlags) {
  std::string host = root_ + "/A/Host.app";
  std::string hostAxctl = bundles::hostApplication(host, AXCTL_EXECUTABLE);
  std::string otherAxctl = bundles::hostApplication(root_ + "/A/Other.app", AXCTL_EXECUTABLE);
  add({bundles::writePlugIn(
           host + "/PlugIns/vis.dedicated.appex",
           {.id = "vis.dedicated", .extension = {{"Dedicated", Value::boolean(true)}}}),
       inApp("A/Other.app", {.id = "vis.app"}), onSystem({.id = "vis.system"})});
  const std::vector<std::string> everyone = {"vis.app", "vis.system"};

  EXPECT_EQ(matchIds(), everyone);  // this program has no application
  EXPECT_EQ(matchIds(std::nullopt, AXProtocol::kDiscoverSystemOnly),
            std::vector<std::string>{"vis.system"});
  Subprocess::Outcome fromHost = Subprocess::run(hostAxctl, {"match"});
  ASSERT_EQ(fromHost.status, 0) << fromHost.err;
  EXPECT_TRUE(lists(fromHost.out, "vis.dedicated")) << fromHost.out;
  EXPECT_TRUE(lists(fromHost.out, "vis.app")) << fromHost.out;
  Subprocess::Outcome fromOther = Subprocess::run(otherAxctl, {"match"});
  ASSERT_EQ(fromOther.status, 0) << fromOther.err;
  EXPECT_FALSE(lists(fromOther.out, "vis.dedicated")) << fromOther.out;
  EXPECT_TRUE(lists(fromOther.out, "vis.system")) << fromOther.out;

  // Discovering everything lifts both the application and the system-only filters.
  EXPECT_EQ(client_->outcome(matchRequest(std::nullopt, kAll)), kUnauthorized);
  grant({{kManager, Value::boolean(true)}});
  EXPECT_EQ(matchIds(std::nullopt, kAll | AXProtocol::kDiscoverSystemOnly),
            (std::vector<std::string>{"vis.app", "vis.dedicated", "vis.system"}));
}

TEST_F(DiscoveryTest, DiscoveringEverythingIsRefusedToASandboxedManager) {
  add({inApp("A/One.app", {.id = "any.plugin"})});
  bundles::grantProgram(root_, "axctl", AXCTL_EXECUTABLE, {{kManager, Value::boolean(true)}});
  Subprocess::Outcome plain = axctl({"match", "--flags", "512"});
  ASSERT_EQ(plain.status, 0) << plain.err;
  EXPECT_TRUE(lists(plain.out, "any.plugin")) << plain.out;

  Subprocess::Outcome sandboxed = axctlUnderSeccomp({"match", "--flags", "512"});
  if (sandboxed.status == kNoSeccomp) GTEST_SKIP() << "no seccomp filters here";
  EXPECT_EQ(sandboxed.status, 1);
  EXPECT_NE(sandboxed.err.find("error " + kUnauthorized), std::string::npos) << sandboxed.err;
  // The refusal concerns the flag only: the same client may discover what it may see.
  Subprocess::Outcome ordinary = axctlUnderSeccomp({"match"});
  EXPECT_EQ(ordinary.status, 0) << ordinary.err;
}

TEST_F(DiscoveryTest, UserExclusionsCountFromTheNextRequestEvenForDiscoverAll) {
  add({inApp("A/One.app", {.id = "ex.keep"}), inApp("A/One.app", {.id = "ex.drop"}),
       inApp("A/One.app", {.id = "ex.other"})});
  grant({{kManager, Value::boolean(true)}});
  ASSERT_EQ(matchIds().size(), 3u);

  // An element that is no rule excludes nothing; the daemon keeps running meanwhile.
  ASSERT_TRUE(
      prefs::Preferences::setValue(
          "exclusions",
          Value::array({Value::string("junk"),
                        Value::dictionary({{"QSExtensionIdentifier", Value::string("ex.drop")}})}),
          kUserPrefs)
          .ok());
  const std::vector<std::string> kept = {"ex.keep", "ex.other"};
  EXPECT_EQ(matchIds(), kept);
  EXPECT_EQ(matchIds(std::nullopt, kAll), kept);
  EXPECT_TRUE(daemon().waitForLog(thisClient() + " plugin ex.drop excluded"));

  ASSERT_TRUE(prefs::Preferences::setValue(
                  "exclusions",
                  Value::array({Value::dictionary(
                      {{"QSExtensionIdentifier",
                        Value::array({Value::string("ex.keep"), Value::string("ex.other")})}})}),
                  kUserPrefs)
                  .ok());
  EXPECT_EQ(matchIds(std::nullopt, kAll), std::vector<std::string>{"ex.drop"});
  ASSERT_TRUE(prefs::Preferences::setValue("exclusions", std::nullopt, kUserPrefs).ok());
  EXPECT_EQ(matchIds().size(), 3u);
}

TEST_F(DiscoveryTest, OverridesAreLinkedBothWays) {
  auto replacing = [](const std::string& id, Value replaced) {
    return PlugInContents{.id = id, .entitlements = {{kReplacePlugIn, std::move(replaced)}}};
  };
  add({inApp("A/One.app", {.id = "over.a"}),
       inApp("A/One.app", replacing("over.b", Value::string("over.a"))),
       inApp("A/One.app",
             replacing("over.c", Value::array({Value::string("over.d"), Value::integer(7),
                                               Value::string("over.e")}))),
       inApp("A/One.app", {.id = "over.d"}), inApp("A/One.app", {.id = "over.e"}),
       inApp("A/One.app", replacing("over.f", Value::string("not.installed")))});
  std::map<std::string, Dictionary> forms = byIdentifier(match());
  ASSERT_EQ(forms.size(), 6u);
  auto field = [&](const char* id, const char* key) { return text(forms[id], key); };

  EXPECT_EQ(field("over.a", "overrider"), field("over.b", "uuid"));
  EXPECT_EQ(field("over.b", "overriding"), "over.a");
  EXPECT_EQ(field("over.d", "overrider"), field("over.c", "uuid"));
  EXPECT_EQ(field("over.e", "overrider"), field("over.c", "uuid"));
  EXPECT_EQ(field("over.c", "overriding"), "over.e");  // the last replaced form in the reply
  for (const char* id : {"over.a", "over.d", "over.e", "over.f"}) {
    EXPECT_FALSE(forms[id].find("overriding")) << id;
  }
  for (const char* id : {"over.b", "over.c", "over.f"})
    EXPECT_FALSE(forms[id].find("overrider")) << id;
}

TEST_F(DiscoveryTest, FormsCarryTheAnnotationsThatAnnotateStored) {
  add({inApp("A/One.app", {.id = "an.one"}), inApp("A/One.app", {.id = "an.two"})});
  std::map<std::string, Dictionary> forms = byIdentifier(match());
  ASSERT_EQ(forms.size(), 2u);
  for (const auto& [id, form] : forms) {
    ASSERT_TRUE(form.find("annotations")) << id;
    EXPECT_EQ(*form.find("annotations"), Value::dictionary({})) << id;
  }
  auto annotate = [&](const char* id, const Dictionary& annotations) {
    auto request = client_->client().request(AXProtocol::kAnnotate,
                                             {*value::Uuid::parse(text(forms[id], "uuid"))}, 0);
    request[AXProtocol::kAnnotations] = Value::dictionary(annotations);
    return client_->outcome(request);
  };
  const Value extension = Value::dictionary({{"k", Value::string("v")}});
  EXPECT_EQ(annotate("an.one", {{"election", Value::integer(257)},
                                {"extension", extension},
                                {"unrelated", Value::integer(1)}}),
            "ok");
  EXPECT_EQ(annotate("an.two", {{"election", Value::integer(1)}, {"extension", Value::array({})}}),
            "4: invalid request format (annotation extension)");
  EXPECT_EQ(annotate("an.two", {{"election", Value::string("1")}, {"extension", extension}}),
            "4: invalid request format (annotation election)");

  forms = byIdentifier(match());
  const Dictionary* stored = forms["an.one"].find("annotations")->asDictionary();
  ASSERT_TRUE(stored);
  EXPECT_EQ(stored->size(), 2u) << Value::dictionary(*stored).description();
  EXPECT_EQ(stored->find("election")->integerValue(), 257);
  EXPECT_EQ(*stored->find("extension"), extension);
  EXPECT_EQ(*forms["an.two"].find("annotations"), Value::dictionary({}));

  // The rule language reads an election without bits 8 to 15.
  auto election = [](const char* pattern) {
    return Value::dictionary({{"QSUserElection", Value::string(pattern)}});
  };
  EXPECT_EQ(matchIds(election("1")), std::vector<std::string>{"an.one"});
  EXPECT_EQ(matchIds(election("0")), std::vector<std::string>{"an.two"});
  EXPECT_EQ(matchIds(election("257")), std::vector<std::string>{});
}

TEST_F(DiscoveryTest, RulesSelectByMediaTypeVersionAndAlternatives) {
  std::filesystem::create_directories(root_ + "/usr/share/mime");
  std::ofstream(root_ + "/usr/share/mime/subclasses")
      << "image/x-portable-bitmap image/x-portable-anymap\ntext/html text/plain\n";
  std::ofstream(root_ + "/usr/share/mime/aliases") << "image/jpg image/jpeg\n";
  auto typed = [&](const std::string& id, Value types, const std::string& level) {
    return inApp(
        "A/One.app",
        {.id = id, .attributes = {{"Types", std::move(types)}, {"Level", Value::string(level)}}});
  };
  add({typed("ty.png", Value::array({Value::string("image/png")}), "1.0"),
       typed("ty.pbm", Value::string("image/x-portable-bitmap"), "3.1"),
       typed("ty.anymap",
             Value::array({Value::string("text/plain"), Value::string("image/x-portable-anymap")}),
             "2"),
       typed("ty.html", Value::string("text/html"), "2.10"),
       typed("ty.jpg", Value::string("image/jpg"), "2.9")});

  auto strings = [](std::initializer_list<const char*> texts) {
    value::Array array;
    for (const char* t : texts) array.push_back(Value::string(t));
    return Value::array(std::move(array));
  };
  const std::vector<std::pair<Dictionary, std::vector<std::string>>> cases = {
      {{{"Types", Value::string("?UT-CONFORMS:image/*")}},
       {"ty.anymap", "ty.jpg", "ty.pbm", "ty.png"}},
      {{{"Types", Value::string("?UT-CONFORMS:image/x-portable-anymap")}}, {"ty.anymap", "ty.pbm"}},
      {{{"Types", Value::string("?UT-CONFORMS:image/jpeg")}}, {"ty.jpg"}},
      {{{"Types", Value::string("?UT-IS:image/x-portable-bitmap")}}, {"ty.anymap", "ty.pbm"}},
      {{{"Types", Value::string("?UT-IS:text/html")}}, {"ty.anymap", "ty.html"}},
      {{{"Types", Value::string("?UT-LIKE:image/png")}}, {}},
      {{{"Level", strings({"1.0", ">=3"})}}, {"ty.pbm", "ty.png"}},
      {{{"Level", Value::string(">=2.9")}}, {"ty.html", "ty.jpg", "ty.pbm"}},
      {{{"Level", Value::string("<>2.9")},
        {"QSExtensionIdentifier", strings({"ty.html", "ty.jpg"})}},
       {"ty.html"}},
  };
  for (const auto& [rule, expected] : cases) {
    EXPECT_EQ(matchIds(Value::dictionary(rule)), expected) << Value::dictionary(rule).description();
  }
  EXPECT_TRUE(daemon().waitForLog("unrecognized match operator:?UT-LIKE:image/png"));
  for (const Value& bad : {Value::string("QSExtensionIdentifier"), strings({"ty.png"})}) {
    EXPECT_EQ(client_->outcome(matchRequest(bad, 0)),
              "4: invalid request format (bad rules dictionary)");
  }
}

TEST_F(DiscoveryTest, TheHostsEntitlementsDecideWhatItMaySee) {
  add({inApp("A/One.app", {.id = "a.b.c"}), inApp("A/One.app", {.id = "pol.plain"}),
       inApp("A/One.app", {.id = "pol.needs.x",
                           .extension = {{"QSExtensionHostEntitlement", Value::string("x")}}})});
  const std::vector<std::string> plain = {"a.b.c", "pol.plain"};
  const std::vector<std::string> all = {"a.b.c", "pol.needs.x", "pol.plain"};
  struct Row {
    const char* name;
    Dictionary entitlements;
    std::uint64_t flags;
    std::vector<std::string> expected;
  };
  // Every policy case is tested in-process; here, that discovery applies the policy and that
  // discovering everything skips it.
  const std::vector<Row> rows = {
      {"none", {}, 0, plain},
      {"restriction not a rule", {{kAllowedPlugIns, Value::string("a.b.c")}}, 0, {}},
      {"x true", {{"x", Value::boolean(true)}}, 0, all},
      {"policy skipped for discover-all",
       {{kManager, Value::boolean(true)}, {kAllowedPlugIns, Value::string("a.b.c")}},
       kAll,
       all},
  };
  for (const Row& row : rows) {
    grant(row.entitlements);
    EXPECT_EQ(matchIds(std::nullopt, row.flags), row.expected) << row.name;
  }
  EXPECT_TRUE(daemon().waitForLog(
      thisClient() + " cannot use plugin pol.plain: invalid host restriction entitlement"));
}

TEST_F(DiscoveryTest, ProtocolVersionTwoGetsNoMatches) {
  add({inApp("A/One.app", {.id = "v2.plugin"})});
  ASSERT_EQ(match().size(), 1u);
  client_->client().setProtocolVersion(AXProtocol::kPreviousVersion);
  EXPECT_EQ(client_->outcome(matchRequest(std::nullopt, 0)), "ok");
}

}  // namespace
