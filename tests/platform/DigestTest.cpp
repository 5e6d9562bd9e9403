#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>
#include <string>

#include "TempDirectory.h"
#include "platform/os/Digest.h"

namespace {

using os::Digest;

TEST(DigestTest, KnownAnswers) {
  EXPECT_EQ(Digest::hex(Digest::sha1("abc")), "a9993e364706816aba3e25717850c26c9cd0d89d");
  EXPECT_EQ(Digest::hex(Digest::sha1("")), "da39a3ee5e6b4b0d3255bfef95601890afd80709");
  EXPECT_EQ(Digest::hex(Digest::sha256("abc")),
            "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad");
  EXPECT_EQ(Digest::hex(Digest::sha256("")),
            "e3b0c44298fc1c149afbf4c8996fb92427ae41e4649b934ca495991b7852b855");
  // A NUL byte is data, not the end of the input.
  EXPECT_EQ(Digest::hex(Digest::sha256(std::string_view("\0", 1))),
            "6e340b9cffb37a989ca544e6bb780a2c78901d3fb33738768511a30617afa01d");
}

TEST(DigestTest, HmacSha256KnownAnswers) {
  // RFC 4231 cases 1, 2 and 6 (a key longer than the block is hashed first), and empty input.
  EXPECT_EQ(Digest::hex(Digest::hmacSha256(std::string(20, '\x0b'), "Hi There")),
            "b0344c61d8db38535ca8afceaf0bf12b881dc200c9833da726e9376c2e32cff7");
  EXPECT_EQ(Digest::hex(Digest::hmacSha256("Jefe", "what do ya want for nothing?")),
            "5bdcc146bf60754e6a042426089575c75a003f089d2739839dec58b964ec3843");
  EXPECT_EQ(
      Digest::hex(Digest::hmacSha256(std::string(131, '\xaa'),
                                     "Test Using Larger Than Block-Size Key - Hash Key First")),
      "60e431591ee0b67f0d8a26aacbf5b77f8e0bc6213728c5140546040f0ee37f54");
  EXPECT_EQ(Digest::hex(Digest::hmacSha256("", "")),
            "b613679a0814d9ec772f95d778c35fc5ff1697c493715653c6c712144292c5ad");
}

TEST(DigestTest, FilesAreDigestedWholeFromOffsetZero) {
  TempDirectory dir;
  ASSERT_FALSE(dir.path().empty());
  // Larger than one read, and not a multiple of it.
  std::string contents;
  for (int i = 0; i < 200003; ++i) contents.push_back(static_cast<char>(i * 7));
  std::string file = dir.write("big", contents);
  std::string expected = Digest::hex(Digest::sha256(contents));
  EXPECT_EQ(Digest::sha256File(file).value(), expected);

  int fd = open(file.c_str(), O_RDONLY);
  ASSERT_GE(fd, 0);
  ASSERT_EQ(lseek(fd, 5, SEEK_SET), 5);
  EXPECT_EQ(Digest::sha256File(fd).value(), expected);
  EXPECT_EQ(lseek(fd, 0, SEEK_CUR), 5);
  close(fd);

  EXPECT_EQ(Digest::sha256File(dir.write("empty", "")).value(), Digest::hex(Digest::sha256("")));
}

TEST(DigestTest, UnreadableFilesFailWithTheSystemError) {
  TempDirectory dir;
  ASSERT_FALSE(dir.path().empty());
  auto missing = Digest::sha256File(dir / "missing");
  ASSERT_FALSE(missing.ok());
  EXPECT_EQ(missing.error().errnum, ENOENT);
  auto directory = Digest::sha256File(dir.path());
  ASSERT_FALSE(directory.ok());
  EXPECT_EQ(directory.error().errnum, EISDIR);
  EXPECT_EQ(Digest::sha256File(-1).error().errnum, EBADF);
}

}  // namespace
