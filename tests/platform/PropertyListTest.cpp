#include <gtest/gtest.h>
#include <plist/plist.h>

#include <cerrno>
#include <filesystem>
#include <string>

#include "platform/value/PropertyList.h"

namespace {

using value::Dictionary;
using value::PropertyList;
using value::Value;

// The error number of |result|, 0 when it succeeded.
template <typename T>
int errnumOf(const os::Result<T>& result) {
  return result.ok() ? 0 : result.error().errnum;
}

std::span<const std::uint8_t> bytesOf(std::string_view text) {
  return {reinterpret_cast<const std::uint8_t*>(text.data()), text.size()};
}

std::string xmlPlist(std::string_view body) {
  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<!DOCTYPE plist PUBLIC \"-//Apple//DTD PLIST "
         "1.0//EN\" \"http://www.apple.com/DTDs/PropertyList-1.0.dtd\">\n<plist version=\"1.0\">" +
         std::string(body) + "</plist>\n";
}

std::string repeat(std::string_view s, std::size_t n) {
  std::string out;
  for (std::size_t i = 0; i < n; ++i) out += s;
  return out;
}

std::string nestedXml(std::size_t depth) {
  return xmlPlist(repeat("<array>", depth) + repeat("</array>", depth));
}

// A binary property list written by hand: each object is given as its bytes; references and
// offsets are 4 bytes wide.
std::vector<std::uint8_t> binaryPlist(const std::vector<std::vector<std::uint8_t>>& objects) {
  std::vector<std::uint8_t> out = {'b', 'p', 'l', 'i', 's', 't', '0', '0'};
  auto put = [&](std::uint64_t v, int width) {
    for (int i = width - 1; i >= 0; --i) out.push_back(static_cast<std::uint8_t>(v >> (8 * i)));
  };
  std::vector<std::uint64_t> offsets;
  for (const auto& object : objects) {
    offsets.push_back(out.size());
    out.insert(out.end(), object.begin(), object.end());
  }
  std::uint64_t table = out.size();
  for (std::uint64_t offset : offsets) put(offset, 4);
  out.insert(out.end(), {0, 0, 0, 0, 0, 0, 4, 4});
  put(objects.size(), 8);
  put(0, 8);
  put(table, 8);
  return out;
}

std::vector<std::uint8_t> arrayOf(std::initializer_list<std::uint32_t> refs) {
  std::vector<std::uint8_t> object = {static_cast<std::uint8_t>(0xA0 | refs.size())};
  for (std::uint32_t ref : refs) {
    for (int i = 3; i >= 0; --i) object.push_back(static_cast<std::uint8_t>(ref >> (8 * i)));
  }
  return object;
}

std::vector<std::uint8_t> toBinary(plist_t root) {
  char* bin = nullptr;
  std::uint32_t length = 0;
  plist_to_bin(root, &bin, &length);
  std::vector<std::uint8_t> bytes(bin, bin + length);
  plist_to_bin_free(bin);
  plist_free(root);
  return bytes;
}

// What writing and reading back does not show: markup in comments, entities, and integers past
// INT64_MAX, which read as their 64-bit pattern.
TEST(PropertyListTest, XmlReadsWhatOthersWrite) {
  auto value = PropertyList::read(bytesOf(xmlPlist(R"(<dict>
    <key>count</key><integer>-5</integer>
    <key>big</key><integer>18446744073709551615</integer>
    <!-- a comment </dict> does not end anything -->
    <key>list</key><array><string>a &amp; b</string><dict/></array>
  </dict>)")));
  ASSERT_TRUE(value.ok()) << value.error().message;
  EXPECT_EQ(value.value(),
            Value::dictionary({
                {"count", Value::integer(-5)},
                {"big", Value::integer(-1)},
                {"list", Value::array({Value::string("a & b"), Value::dictionary({})})},
            }));
  EXPECT_EQ(value.value().asDictionary()->find("count")->type(), value::Type::Int);
}

TEST(PropertyListTest, BinaryReadsWithDatesConverted) {
  plist_t root = plist_new_dict();
  plist_dict_set_item(root, "before", plist_new_date(-1, -500000));  // 1.5 s before 2001
  plist_dict_set_item(root, "after", plist_new_date(86400, 250000));
  auto value = PropertyList::read(toBinary(root));
  ASSERT_TRUE(value.ok()) << value.error().message;
  const Dictionary& d = *value.value().asDictionary();
  EXPECT_EQ(d.find("before")->asDate()->seconds, 978307198.5);
  EXPECT_EQ(d.find("after")->asDate()->seconds, 978393600.25);
}

TEST(PropertyListTest, ValuesWithoutPropertyListFormAreNotWritten) {
  const Value refused[] = {
      Value::uuid(value::Uuid()),
      Value::unsignedInteger(UINT64_MAX),
      Value::array({Value::string(std::string("a\0b", 3))}),
      Value::dictionary({{std::string("k\0", 2), Value::integer(1)}}),
      Value::date({1e12}),
      Value::array({Value::dictionary({{"n", Value()}})}),
  };
  for (const Value& v : refused) {
    EXPECT_EQ(errnumOf(PropertyList::toXml(v)), EINVAL) << v.description();
  }
}

TEST(PropertyListTest, BrokenInputIsRefused) {
  plist_t uid = plist_new_array();
  plist_array_append_item(uid, plist_new_uid(3));
  std::vector<std::uint8_t> truncated = toBinary(plist_new_string("truncated"));
  truncated.resize(truncated.size() - 5);
  const std::vector<std::uint8_t> inputs[] = {
      {},
      toBinary(uid),
      truncated,
      binaryPlist({arrayOf({0})}),  // an array that contains itself
      binaryPlist({arrayOf({7})}),  // a reference past the objects
  };
  for (const auto& bytes : inputs) EXPECT_EQ(errnumOf(PropertyList::read(bytes)), EINVAL);
  for (const char* xml :
       {"<dict><key>a</key></array>", "plain", "<date>2100-01-01T00:00:00Z</date>"}) {
    EXPECT_FALSE(PropertyList::read(bytesOf(xmlPlist(xml))).ok()) << xml;
  }
}

TEST(PropertyListTest, DepthIsLimitedInBothEncodings) {
  EXPECT_TRUE(PropertyList::read(bytesOf(nestedXml(128))).ok());
  EXPECT_FALSE(PropertyList::read(bytesOf(nestedXml(129))).ok());
  // Far deeper than libplist's own recursion survives.
  EXPECT_FALSE(PropertyList::read(bytesOf(nestedXml(400000))).ok());
  // Markup hidden in comments may not lower the count.
  std::string hidden = repeat("<array><!-- </array> -->", 200) + repeat("</array>", 200);
  EXPECT_FALSE(PropertyList::read(bytesOf(xmlPlist(hidden))).ok());

  auto chain = [](std::uint32_t depth) {
    std::vector<std::vector<std::uint8_t>> objects;
    for (std::uint32_t i = 1; i < depth; ++i) objects.push_back(arrayOf({i}));
    objects.push_back(arrayOf({}));
    return binaryPlist(objects);
  };
  EXPECT_TRUE(PropertyList::read(chain(128)).ok());
  EXPECT_NE(PropertyList::read(chain(129)).error().message.find("deeper than 128"),
            std::string::npos);
  EXPECT_FALSE(PropertyList::read(chain(200000)).ok());
}

// Object i is an array holding object i + 1 twice: 40 objects would expand to 2^40 values.
TEST(PropertyListTest, SharedObjectsCannotExpandWithoutBound) {
  std::vector<std::vector<std::uint8_t>> objects;
  for (std::uint32_t i = 1; i < 40; ++i) objects.push_back(arrayOf({i, i}));
  objects.push_back({0x51, 'x'});
  EXPECT_NE(PropertyList::read(binaryPlist(objects)).error().message.find("expands"),
            std::string::npos);
}

// libplist asserts, ending the process, when it hands back a key holding NUL; a dictionary's key
// must also be a string. Each crash-* file in the fuzz corpus once ended the process.
TEST(PropertyListTest, KeysLibplistCannotHoldAreRefused) {
  auto dictOf = [](std::uint32_t key, std::uint32_t value) {
    std::vector<std::uint8_t> object = arrayOf({key, value});
    object[0] = 0xD1;
    return object;
  };
  const std::vector<std::uint8_t> keys[] = {
      {0x53, 'a', 0, 'b'},           // ASCII
      {0x62, 0, 0xE9, 0, 0},         // UTF-16
      {0x5F, 0x10, 3, 'a', 'b', 0},  // a longer count, given as an integer
      {0x10, 7},                     // an integer
  };
  for (const auto& key : keys) {
    EXPECT_EQ(errnumOf(PropertyList::read(binaryPlist({dictOf(1, 2), key, {0x09}}))), EINVAL);
    EXPECT_EQ(errnumOf(PropertyList::read(binaryPlist({arrayOf({1}), dictOf(2, 3), key, {0x09}}))),
              EINVAL);
  }
  EXPECT_TRUE(
      PropertyList::read(binaryPlist({dictOf(1, 2), {0x62, 0, 0xE9, 0, 'x'}, {0x09}})).ok());
  for (const char* key : {"a&#0;b", "a&#x0;b"}) {
    std::string xml = xmlPlist("<dict><key>" + std::string(key) + "</key><true/></dict>");
    EXPECT_EQ(errnumOf(PropertyList::read(bytesOf(xml))), EINVAL) << key;
  }
  std::size_t crashes = 0;
  for (const auto& entry : std::filesystem::directory_iterator(AXD_PLIST_CORPUS)) {
    if (!entry.path().filename().string().starts_with("crash-")) continue;
    ++crashes;
    EXPECT_EQ(errnumOf(PropertyList::readFile(entry.path())), EINVAL) << entry.path();
  }
  EXPECT_GT(crashes, 0u);
}

// A malformed file names its path in the error, as WorkspaceTest sees with a broken Info.plist.
TEST(PropertyListTest, UnreadableFilesFailWithTheSystemError) {
  EXPECT_EQ(PropertyList::readFile("/nonexistent/Info.plist").error().errnum, ENOENT);
  EXPECT_EQ(PropertyList::readFile(::testing::TempDir()).error().errnum, EISDIR);
}

}  // namespace
