#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>

#include "platform/sandbox/GrantTable.h"
#include "platform/sandbox/Sandbox.h"
#include "tests/plugin/DeviceRoot.h"

namespace {

using sandbox::GrantTable;
using sandbox::Sandbox;

class SandboxExtensionTest : public DeviceRootTest {
 protected:
  void SetUp() override {
    DeviceRootTest::SetUp();
    file_ = root_.write("file.txt", "contents");
  }

  std::string issue(const std::string& path) {
    os::Result<std::string> token =
        Sandbox::issueFileExtension(sandbox::kReadExtensionClass, path, true);
    EXPECT_TRUE(token.ok()) << token.error().message;
    return token.ok() ? token.value() : "";
  }

  // The path the grant of a freshly consumed |token| names, released again.
  std::string grantedPath(const std::string& token) {
    os::Result<std::int64_t> handle = Sandbox::consume(token);
    if (!handle.ok()) return "error " + std::to_string(handle.error().errnum);
    std::optional<sandbox::ExtensionToken> grant = GrantTable::shared().find(handle.value());
    EXPECT_TRUE(Sandbox::release(handle.value()).ok());
    return grant ? grant->path() : "no grant";
  }

  int consumeError(const std::string& token) {
    os::Result<std::int64_t> handle = Sandbox::consume(token);
    if (handle.ok()) Sandbox::release(handle.value());
    return handle.ok() ? 0 : handle.error().errnum;
  }

  std::string file_;
};

TEST_F(SandboxExtensionTest, ATokenNamesTheCanonicalPathUnlessAskedToTakeItAsGiven) {
  directory("dir/sub");
  std::filesystem::create_symlink(file_, root_ / "link");
  std::string odd = root_.write("a;b\nc d", "x");
  EXPECT_EQ(grantedPath(issue(root_ / "link")), canonical(file_));
  EXPECT_EQ(grantedPath(issue(root_ / "dir/sub/../../file.txt")), canonical(file_));
  EXPECT_EQ(grantedPath(issue(odd)), canonical(odd));  // any byte of the path survives
  os::Result<std::string> asGiven =
      Sandbox::issueFileExtension(sandbox::kReadExtensionClass, root_ / "link", false);
  ASSERT_TRUE(asGiven.ok());
  EXPECT_EQ(grantedPath(asGiven.value()), root_ / "link");
}

TEST_F(SandboxExtensionTest, IssuingFailsWithTheErrorOfRealpath) {
  auto errnum = [](const std::string& extensionClass, const std::string& path, bool canonicalize) {
    auto token = Sandbox::issueFileExtension(extensionClass, path, canonicalize);
    return token.ok() ? 0 : token.error().errnum;
  };
  const std::string read = sandbox::kReadExtensionClass;
  EXPECT_EQ(errnum(read, root_ / "no", true), ENOENT);
  EXPECT_EQ(errnum(read, root_ / "no", false), ENOENT);
  EXPECT_EQ(errnum(read, "file.txt", false), EINVAL);  // relative, taken as given
  EXPECT_EQ(errnum("", file_, true), EINVAL);
  EXPECT_EQ(errnum("a;b", file_, true), EINVAL);
}

TEST_F(SandboxExtensionTest, AlteredTokensAreRefused) {
  std::string token = issue(file_);
  std::size_t pathStart = token.find(';', 3) + 1;
  std::size_t macStart = token.rfind(';') + 1;

  std::string otherPath = token;
  otherPath[pathStart + 2] = otherPath[pathStart + 2] == '0' ? '1' : '0';
  EXPECT_EQ(consumeError(otherPath), EPERM);

  std::string otherMac = token;
  otherMac[macStart] = otherMac[macStart] == '0' ? '1' : '0';
  EXPECT_EQ(consumeError(otherMac), EPERM);

  std::string otherClass = "v1;other.class" + token.substr(token.find(';', 3));
  EXPECT_EQ(consumeError(otherClass), EPERM);
}

TEST_F(SandboxExtensionTest, MalformedTokensAreInvalid) {
  std::string token = issue(file_);
  std::string upperCase = token;
  for (std::size_t i = token.rfind(';') + 1; i < upperCase.size(); ++i) {
    upperCase[i] = static_cast<char>(toupper(upperCase[i]));
  }
  for (const std::string& text :
       {std::string(), std::string("v1"), "v2" + token.substr(2), token.substr(0, token.size() - 1),
        token + ";", token.substr(0, token.rfind(';')), upperCase,
        "v1;;" + token.substr(token.find(';', 3) + 1), std::string("v1;c;;") + std::string(64, '0'),
        std::string("v1;c;00;") + std::string(64, '0')}) {
    EXPECT_EQ(consumeError(text), EINVAL) << text;
  }
}

TEST_F(SandboxExtensionTest, ATokenForAPathThatVanishedOrOfAnotherRootIsRefused) {
  std::string token = issue(file_);
  TempDirectory otherRoot;
  environment_.set("ANNEXA_ROOT", otherRoot.path());
  EXPECT_EQ(consumeError(token), EPERM);
  environment_.set("ANNEXA_ROOT", root_.path());
  ASSERT_EQ(unlink(file_.c_str()), 0);
  EXPECT_EQ(consumeError(token), ENOENT);
}

}  // namespace
