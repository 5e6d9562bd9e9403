#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <filesystem>
#include <fstream>

#include "ScopedEnvironment.h"
#include "TempDirectory.h"
#include "platform/codesign/DigestCache.h"
#include "platform/codesign/EntitlementTable.h"
#include "platform/codesign/Task.h"
#include "platform/os/Digest.h"
#include "platform/os/Paths.h"
#include "platform/os/Process.h"

extern char** environ;

namespace {

using codesign::EntitlementTable;
using codesign::Task;
using value::Value;

const std::string kTableDir = "etc/annexa/entitlements.d";

std::string plist(const std::string& body) {
  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
         "<!DOCTYPE plist PUBLIC \"-//Apple//DTD PLIST 1.0//EN\" "
         "\"http://www.apple.com/DTDs/PropertyList-1.0.dtd\">\n"
         "<plist version=\"1.0\">\n" +
         body + "\n</plist>\n";
}

// A table file granting the boolean entitlement |key| to |executable|.
std::string grant(const std::string& executable, const std::string& key,
                  const std::string& sha256 = "") {
  std::string digest = sha256.empty() ? "" : "<key>SHA256</key><string>" + sha256 + "</string>";
  return plist("<dict><key>Executable</key><string>" + executable + "</string>" + digest +
               "<key>Entitlements</key><dict><key>" + key + "</key><true/></dict></dict>");
}

std::unique_ptr<Task> taskOf(pid_t pid) {
  auto pidfd = os::Process::openPidfd(pid);
  if (!pidfd.ok()) return nullptr;
  std::unique_ptr<Task> task = Task::fromAuditToken(pid, pidfd.value());
  close(pidfd.value());
  return task;
}

bool has(const Task& task, const std::string& key) {
  return task.entitlementValue(key, nullptr).has_value();
}

class EntitlementTableTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ASSERT_FALSE(root_.path().empty());
    env_.set("ANNEXA_ROOT", root_.path());
    std::filesystem::create_directories(root_ / kTableDir);
    self_ = os::Paths::canonical("/proc/self/exe").value();
    selfDigest_ = os::Digest::sha256File(self_).value();
  }

  void writeTable(const std::string& name, const std::string& contents, mode_t mode = 0644) {
    std::string path = root_.write(kTableDir + "/" + name, contents);
    ASSERT_EQ(chmod(path.c_str(), mode), 0);
  }

  std::unique_ptr<Task> selfTask() {
    std::unique_ptr<Task> task = taskOf(getpid());
    EXPECT_NE(task, nullptr);
    return task;
  }

  TempDirectory root_;
  ScopedEnvironment env_;
  std::string self_;
  std::string selfDigest_;
};

TEST_F(EntitlementTableTest, NoTableIsEmptyButAnUnreadableOneFailsEveryLookup) {
  std::filesystem::remove(root_ / kTableDir);
  EXPECT_EQ(EntitlementTable::load().value().size(), 0u);
  auto task = selfTask();
  ASSERT_TRUE(task);
  std::optional<os::Error> error = os::Error{1, "stale"};
  EXPECT_FALSE(task->entitlementValue("org.annexa.any", &error));
  EXPECT_FALSE(error);

  root_.write(kTableDir, "not a directory");
  EXPECT_EQ(EntitlementTable::load().error().errnum, ENOTDIR);
  task = selfTask();
  ASSERT_TRUE(task);
  EXPECT_FALSE(task->entitlementValue("org.annexa.any", &error));
  ASSERT_TRUE(error);
  EXPECT_EQ(error->errnum, ENOTDIR);
}

// The first entry for the executable wins when its digest, if any, matches the image. The last
// entry names the executable through a symbolic link, which must still match.
TEST_F(EntitlementTableTest, TheFirstEntryThatMatchesTheImageWins) {
  std::string upper = selfDigest_;
  std::transform(upper.begin(), upper.end(), upper.begin(),
                 [](unsigned char c) { return static_cast<char>(std::toupper(c)); });
  std::filesystem::create_symlink(self_, root_ / "link");
  writeTable("10-wrong.plist", grant(self_, "org.annexa.wrong", std::string(64, '0')));
  writeTable("20-right.plist", grant(self_, "org.annexa.right", upper));
  writeTable("30-later.plist", grant(root_ / "link", "org.annexa.later"));
  writeTable("40-other.plist", grant("/usr/bin/true", "org.annexa.other"));
  auto task = selfTask();
  ASSERT_TRUE(task);
  EXPECT_EQ(task->executablePath(), self_);
  EXPECT_FALSE(has(*task, "org.annexa.wrong"));
  EXPECT_TRUE(has(*task, "org.annexa.right"));
  EXPECT_FALSE(has(*task, "org.annexa.later"));
  EXPECT_FALSE(has(*task, "org.annexa.other"));

  auto table = EntitlementTable::load();
  ASSERT_TRUE(table.ok());
  ASSERT_TRUE(table.value().lookup(self_, -1));  // the entry without a digest
  EXPECT_TRUE(table.value().lookup(self_, -1)->find("org.annexa.later"));
}

TEST_F(EntitlementTableTest, FilesOthersCouldHaveWrittenAreIgnored) {
  writeTable("world.plist", grant(self_, "org.annexa.world"), 0666);
  writeTable("group.plist", grant(self_, "org.annexa.group"), 0620);
  if (geteuid() == 0) {
    writeTable("owner.plist", grant(self_, "org.annexa.owner"));
    ASSERT_EQ(chown((root_ / kTableDir + "/owner.plist").c_str(), 4321, 4321), 0);
  }
  writeTable("trusted.plist", grant(self_, "org.annexa.trusted"), 0600);
  auto table = EntitlementTable::load();
  ASSERT_TRUE(table.ok());
  EXPECT_EQ(table.value().size(), 1u);
  auto task = selfTask();
  ASSERT_TRUE(task);
  EXPECT_TRUE(has(*task, "org.annexa.trusted"));
}

TEST_F(EntitlementTableTest, MalformedFilesAreSkipped) {
  writeTable("array.plist", plist("<array><string>" + self_ + "</string></array>"));
  writeTable("no-executable.plist", plist("<dict><key>Entitlements</key><dict/></dict>"));
  writeTable("relative.plist", grant("bin/axd", "org.annexa.relative"));
  writeTable("entitlements-array.plist", plist("<dict><key>Executable</key><string>" + self_ +
                                               "</string><key>Entitlements</key><array/></dict>"));
  writeTable("short-digest.plist", grant(self_, "org.annexa.short", selfDigest_.substr(1)));
  writeTable("garbage.plist", std::string("bplist00\xff\x00\x13", 10));
  writeTable(".hidden.plist", grant(self_, "org.annexa.hidden"));
  writeTable("note.txt", grant(self_, "org.annexa.txt"));
  std::filesystem::create_directory(root_ / kTableDir + "/dir.plist");
  ASSERT_EQ(mkfifo((root_ / kTableDir + "/fifo.plist").c_str(), 0600), 0);
  writeTable("good.plist", grant(self_, "org.annexa.good"));

  auto table = EntitlementTable::load();
  ASSERT_TRUE(table.ok());
  EXPECT_EQ(table.value().size(), 1u);
  auto task = selfTask();
  ASSERT_TRUE(task);
  EXPECT_TRUE(has(*task, "org.annexa.good"));
  EXPECT_FALSE(has(*task, "org.annexa.hidden"));
}

TEST_F(EntitlementTableTest, AReplacedExecutableIsNotTrusted) {
  std::filesystem::create_directory(root_ / "bin");
  std::string tool = root_ / "bin/tool";
  std::filesystem::copy_file("/bin/sleep", tool);
  auto digest = os::Digest::sha256File(tool);
  ASSERT_TRUE(digest.ok());
  writeTable("tool.plist", grant(tool, "org.annexa.tool", digest.value()));

  // posix_spawn returns once the child runs the new image.
  pid_t child = 0;
  char arg0[] = "tool", arg1[] = "1000";
  char* argv[] = {arg0, arg1, nullptr};
  ASSERT_EQ(posix_spawn(&child, tool.c_str(), nullptr, nullptr, argv, environ), 0);
  auto before = taskOf(child);
  ASSERT_TRUE(before);
  EXPECT_TRUE(has(*before, "org.annexa.tool"));

  root_.write("bin/replacement", "#!/bin/sh\n");
  std::filesystem::rename(root_ / "bin/replacement", tool);
  auto after = taskOf(child);
  kill(child, SIGKILL);
  waitpid(child, nullptr, 0);
  ASSERT_TRUE(after);
  EXPECT_EQ(after->executablePath(), tool + " (deleted)");
  EXPECT_FALSE(has(*after, "org.annexa.tool"));
}

// A digest is remembered per file identity: a file rewritten in place (same inode) is read again.
TEST_F(EntitlementTableTest, ARewrittenImageIsHashedAgain) {
  codesign::DigestCache cache;
  std::string file = root_ / "image";
  auto digestOf = [&] {
    int fd = open(file.c_str(), O_RDONLY | O_CLOEXEC);
    auto digest = cache.sha256(fd, file);
    close(fd);
    return digest.ok() ? digest.value() : std::string();
  };
  root_.write("image", "first");
  const std::string first = digestOf();
  EXPECT_EQ(first, os::Digest::sha256File(file).value());
  std::ofstream(file, std::ios::trunc) << "second, longer";
  EXPECT_NE(digestOf(), first);
  EXPECT_EQ(digestOf(), os::Digest::sha256File(file).value());
}

}  // namespace
