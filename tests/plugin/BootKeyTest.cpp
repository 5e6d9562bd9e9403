#include <gtest/gtest.h>
#include <sys/stat.h>

#include <fstream>
#include <set>
#include <sstream>

#include "platform/os/Digest.h"
#include "platform/os/Paths.h"
#include "platform/sandbox/BootKey.h"
#include "tests/plugin/ChildProcess.h"
#include "tests/plugin/DeviceRoot.h"

namespace {

using sandbox::BootKey;

std::string hexOf(const std::string& bytes) {
  const auto* data = reinterpret_cast<const std::uint8_t*>(bytes.data());
  return os::Digest::hex({data, bytes.size()});
}

std::string contentsOf(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  std::ostringstream out;
  out << in.rdbuf();
  return out.str();
}

std::string bootId() {
  return contentsOf("/proc/sys/kernel/random/boot_id").substr(0, 36);
}

mode_t modeOf(const std::string& path) {
  struct stat st {};
  stat(path.c_str(), &st);
  return st.st_mode & 07777;
}

std::string loadHex() {
  os::Result<std::string> key = BootKey::load();
  return key.ok() ? hexOf(key.value()) : "error " + key.error().message;
}

class BootKeyTest : public DeviceRootTest {
 protected:
  // Writes a key file with |text| and |mode| in place of the current one.
  void plant(const std::string& text, mode_t mode) {
    directory("run/sandbox");
    chmod((root_ / "run/sandbox").c_str(), 0700);  // as the key's directory must be
    std::ofstream(BootKey::path(), std::ios::trunc) << text;
    chmod(BootKey::path().c_str(), mode);
  }
};

TEST_F(BootKeyTest, TheKeyIsMadeOnceAndKeptWithTheBootId) {
  std::string key = loadHex();
  ASSERT_EQ(key.size(), 64u) << key;
  EXPECT_EQ(contentsOf(BootKey::path()), bootId() + "\n" + key + "\n");
  EXPECT_EQ(modeOf(BootKey::path()), 0600u);
  EXPECT_EQ(modeOf(os::Paths::runtimeDir() + "/sandbox") & 077, 0u);
  EXPECT_EQ(loadHex(), key);
}

TEST_F(BootKeyTest, ProcessesOfOneRootShareOneKey) {
  std::vector<std::string> keys = outputsOfChildren(4, loadHex);
  std::set<std::string> distinct(keys.begin(), keys.end());
  ASSERT_EQ(distinct.size(), 1u);
  EXPECT_EQ(keys[0].size(), 64u) << keys[0];
  EXPECT_EQ(loadHex(), keys[0]);
}

TEST_F(BootKeyTest, OnlyAKeyOfThisBootClosedToOthersIsUsed) {
  std::string planted(64, 'c');
  struct Case {
    std::string text;
    mode_t mode;
  };
  for (const Case& unusable : {
           Case{"00000000-0000-0000-0000-000000000000\n" + planted + "\n", 0600},  // another boot
           Case{bootId() + "\n" + planted + "\n", 0644},                           // exposed
           Case{bootId() + "\n" + planted.substr(1) + "\n", 0600},
           Case{bootId() + "\n" + std::string(64, 'C') + "\n", 0600},
           Case{bootId() + " " + planted + "\n", 0600},
       }) {
    plant(unusable.text, unusable.mode);
    std::string key = loadHex();
    EXPECT_EQ(contentsOf(BootKey::path()), bootId() + "\n" + key + "\n") << unusable.text;
    EXPECT_NE(key, planted);
    EXPECT_EQ(modeOf(BootKey::path()), 0600u);
  }
  plant(bootId() + "\n" + planted + "\n", 0600);
  EXPECT_EQ(loadHex(), planted);
}

}  // namespace
