#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>
#include <string>

#include "TempDirectory.h"
#include "platform/os/Digest.h"

namespace {

using os::Digest;

// The digests are OpenSSL's; one answer each shows the right one is used and written as hex.
TEST(DigestTest, KnownAnswers) {
  EXPECT_EQ(Digest::hex(Digest::sha1("abc")), "a9993e364706816aba3e25717850c26c9cd0d89d");
  // A NUL byte is data, not the end of the input.
  EXPECT_EQ(Digest::hex(Digest::sha256(std::string_view("\0", 1))),
            "6e340b9cffb37a989ca544e6bb780a2c78901d3fb33738768511a30617afa01d");
  // RFC 4231 case 2: the key and the message in their places.
  EXPECT_EQ(Digest::hex(Digest::hmacSha256("Jefe", "what do ya want for nothing?")),
            "5bdcc146bf60754e6a042426089575c75a003f089d2739839dec58b964ec3843");
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
  EXPECT_EQ(Digest::sha256File(dir / "missing").error().errnum, ENOENT);
  EXPECT_EQ(Digest::sha256File(dir.path()).error().errnum, EISDIR);
  EXPECT_EQ(Digest::sha256File(-1).error().errnum, EBADF);
}

}  // namespace
