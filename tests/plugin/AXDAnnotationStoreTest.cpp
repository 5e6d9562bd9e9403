#include <gtest/gtest.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <sstream>

#include "axd/AXDAnnotationStore.h"
#include "platform/value/PropertyList.h"
#include "tests/annexa/LogCapture.h"
#include "tests/platform/ScopedEnvironment.h"
#include "tests/platform/TempDirectory.h"
#include "tests/plugin/RegistryRecords.h"

namespace {

using namespace records;
using value::Dictionary;
using value::Value;

Value I(std::int64_t i) {
  return Value::integer(i);
}

std::string plist(const std::string& body) {
  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">" + body +
         "</plist>\n";
}

std::string contentsOf(const std::string& path) {
  std::ostringstream text;
  text << std::ifstream(path, std::ios::binary).rdbuf();
  return text.str();
}

class AXDAnnotationStoreTest : public ::testing::Test {
 protected:
  // A plug-in "com.example.<name>", annotated under |replaces| when given.
  static std::shared_ptr<AXDPlugIn> plugIn(const std::string& name,
                                           std::optional<std::string> replaces = std::nullopt) {
    registrum::PlugInRecord::Fields fields = records::plugIn("/Apps/Host.app/PlugIns/" + name);
    fields.containingApplication = application("/Apps/Host.app");
    fields.plugInIdentifier = fields.originalIdentifier = "com.example." + name;
    fields.infoDictionary =
        fields.infoDictionary.with("QFBundleIdentifier", S("com.example." + name));
    if (replaces) {
      fields.entitlements =
          Dictionary{{std::string(AXD_VENDOR_PREFIX) + ".developer.replace-plugin", S(*replaces)}};
    }
    return build(fields);
  }

  // The file as {"version", "data"}, or an empty dictionary when it is not a property list.
  Dictionary file() const {
    os::Result<Value> read = value::PropertyList::readFile(path_);
    return read.ok() && read.value().asDictionary() ? *read.value().asDictionary() : Dictionary();
  }

  TempDirectory directory_;
  const std::string path_ = directory_ / "Annotations";
};

TEST_F(AXDAnnotationStoreTest, ARejectedFileIsResetAndOverwrittenAtTheFirstChange) {
  const std::string entry =
      "<key>com.example.old</key><dict><key>election</key><integer>1</integer></dict>";
  struct Case {
    const char* name;
    std::string contents;
    const char* domain;
    int code;
    const char* description;
  } cases[] = {
      {"version 15",
       plist("<dict><key>version</key><integer>15</integer><key>data</key><dict>" + entry +
             "</dict></dict>"),
       "Annexa", 7, "found database version 15 needed version 16"},
      {"no version", plist("<dict><key>data</key><dict>" + entry + "</dict></dict>"), "Annexa", 7,
       "found database version 0 needed version 16"},
      {"text version", plist("<dict><key>version</key><string>16</string></dict>"), "Annexa", 7,
       "found database version 0 needed version 16"},
      {"not a plist", "version 16", "POSIX", EINVAL, "Annotations"},
      {"top level", plist("<array/>"), "POSIX", EINVAL, "top level is not a dictionary"},
      {"no data", plist("<dict><key>version</key><integer>16</integer></dict>"), "POSIX", EINVAL,
       "has no \"data\""},
      {"data", plist("<dict><key>version</key><integer>16</integer><key>data</key><array/></dict>"),
       "POSIX", EINVAL, "\"data\" is not a dictionary"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    directory_.write("Annotations", c.contents);
    LogCapture log;
    AXDAnnotationStore store(path_.c_str());
    EXPECT_TRUE(store.annotations().empty());
    EXPECT_NE(log.text().find("unable to load annotation database:" + path_ + " error:"),
              std::string::npos);
    EXPECT_NE(log.text().find(c.description), std::string::npos) << log.text();
    EXPECT_NE(log.text().find("(resetting)"), std::string::npos);
    EXPECT_EQ(contentsOf(path_), c.contents);

    std::optional<AXError> error;
    EXPECT_FALSE(store.loadDb(&error));
    ASSERT_TRUE(error);
    EXPECT_EQ(error->domain(), c.domain);
    EXPECT_EQ(error->code(), c.code);

    store.setAnnotation(Dictionary{{"election", I(2)}}, *plugIn("tool"));
    EXPECT_EQ(file(), (Dictionary{{"version", I(16)},
                                  {"data", D({{"com.example.tool", D({{"election", I(2)}})}})}}));
  }
}

TEST_F(AXDAnnotationStoreTest, APlugInThatReplacesAnotherSharesItsEntry) {
  auto original = plugIn("tool");
  auto replacement = plugIn("newtool", "com.example.tool");
  AXDAnnotationStore store(path_.c_str());
  store.setAnnotation(Dictionary{{"extension", D({})}}, *original);
  store.setAnnotation(Dictionary{{"election", I(2)}}, *replacement);
  EXPECT_EQ(store.annotationForPlugIn(*original),
            (Dictionary{{"election", I(2)}, {"extension", D({})}}));
  EXPECT_EQ(store.annotations().size(), 1u);
  EXPECT_FALSE(store.annotationForIdentifier("com.example.newtool"));
}

// A writer killed at any moment leaves the old file or the new one: a fresh store always loads
// whatever is there.
TEST_F(AXDAnnotationStoreTest, AKilledWriterNeverLeavesAPartialFile) {
  auto tool = plugIn("tool");
  for (int round = 0; round < 30; ++round) {
    pid_t child = fork();
    ASSERT_GE(child, 0);
    if (child == 0) {
      AXDAnnotationStore store(path_.c_str());
      for (std::int64_t n = 0;; ++n) {
        store.setAnnotation(Dictionary{{std::to_string(n % 200), S(std::string(64, 'x'))}}, *tool);
      }
    }
    usleep(static_cast<useconds_t>(round * 700));
    kill(child, SIGKILL);
    int status = 0;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    AXDAnnotationStore fresh(path_.c_str());
    std::optional<AXError> error;
    bool loaded = fresh.loadDb(&error);
    EXPECT_TRUE(loaded || error->code() == ENOENT) << error->description();
  }
}

}  // namespace
