#include <gtest/gtest.h>

#include <filesystem>
#include <string>
#include <vector>

#include "platform/types/ActivationRule.h"
#include "platform/types/MimeDatabaseCache.h"
#include "platform/types/TypeRegistry.h"
#include "tests/platform/ScopedEnvironment.h"
#include "tests/platform/TempDirectory.h"

namespace {

using types::ActivationRule;
using types::TypeRegistry;
using value::Value;

// A device root with its own database, so no test depends on the machine's /usr/share/mime.
class TypeRegistryTest : public ::testing::Test {
 protected:
  void SetUp() override {
    std::filesystem::create_directories(root_ / "usr/share/mime");
    root_.write("usr/share/mime/subclasses",
                "application/xml text/plain\nimage/svg+xml application/xml\n"
                "text/x-chdr text/x-c\n# comment\n\nx-loop/a x-loop/b\nx-loop/b x-loop/a\n"
                "x-loop/c x-loop/c\nImage/X-Portable-Bitmap IMAGE/x-portable-anymap\n"
                "one-field\na/b c/d e/f\nnot a/type\ninode/x-late image/png\n"
                "text/x-csv text/plain\napplication/x-shellscript text/plain\n");
    root_.write("usr/share/mime/aliases",
                "image/jpg image/jpeg\ntext/xml application/xml\n"
                "text/x-c text/x-csrc\n");
    environment_.set("ANNEXA_ROOT", root_.path());
  }

  TempDirectory root_;
  ScopedEnvironment environment_;
};

TEST_F(TypeRegistryTest, Conformance) {
  struct Case {
    const char* type;
    const char* to;
    bool expected;
  } cases[] = {
      {"IMAGE/PNG", "image/Png", true},
      {"text", "text/*", false},  // no concrete type
      {"text/plain; charset=utf-8", "text/plain", false},
      {"a/b/c", "a/*", false},
      {"image/*", "image/png", false},
      {"image/*", "*/*", false},
      {"*/*", "*/*", true},
      {"text/x-foo", "text/plain", true},  // built in
      {"text/plain", "text/x-foo", false},
      {"image/png", "application/octet-stream", true},
      {"image/jpeg", "IMAGE/JPG", true},
      {"text/xml", "text/plain", true},
      {"text/x-chdr", "text/x-csrc", true},  // the parent in the file is an alias
      {"x-loop/a", "image/png", false},
      {"image/x-portable-bitmap", "image/x-portable-anymap", true},
      // Wildcards: the type, its aliases and its declared parents count; the universal parents
      // only as the type itself.
      {"image/png", "application/*", false},
      {"image/png", "*/*", true},
      {"application/octet-stream", "application/*", true},
      {"text/plain", "text/*", true},
      {"text/x-csv", "text/plain", true},
      {"text/x-csv", "text/*", true},
      {"text/x-csv", "application/*", false},
      {"application/x-shellscript", "text/plain", true},
      {"application/x-shellscript", "text/*", false},
      {"image/jpg", "image/*", true},       // an alias
      {"application/xml", "text/*", true},  // through its alias text/xml
      {"text/xml", "application/*", true},  // an alias of application/xml
      {"image/svg+xml", "application/*", true},
      {"image/svg+xml", "TEXT/*", true},  // its parent's alias
      {"image/svg+xml", "audio/*", false},
      {"x-unknown/thing", "x-unknown/*", true},  // a type the database does not know
      {"x-unknown/thing", "*/*", true},
      {"x-unknown/thing", "application/*", false},
      {"x-unknown/thing", "application/octet-stream", true},
      {"inode/x-late", "image/*", true},  // malformed lines are skipped, not fatal
  };
  for (const Case& c : cases) {
    EXPECT_EQ(TypeRegistry::conforms(c.type, c.to), c.expected) << c.type << " -> " << c.to;
  }
}

TEST_F(TypeRegistryTest, CacheRereadsAChangedFileOnlyAfterItsInterval) {
  types::MimeDatabaseCache eager(std::chrono::seconds(0));
  types::MimeDatabaseCache lazy(std::chrono::hours(1));
  std::string directory = root_ / "usr/share/mime";
  ASSERT_EQ(eager.databaseFor(directory)->parents("image/svg+xml").size(), 1u);
  ASSERT_EQ(lazy.databaseFor(directory)->parents("image/svg+xml").size(), 1u);
  root_.write("usr/share/mime/subclasses", "image/svg+xml application/xml\nimage/svg+xml x/y\n");
  EXPECT_EQ(eager.databaseFor(directory)->parents("image/svg+xml").size(), 2u);
  EXPECT_EQ(lazy.databaseFor(directory)->parents("image/svg+xml").size(), 1u);
  std::filesystem::remove(root_ / "usr/share/mime/aliases");  // a missing file is empty
  EXPECT_EQ(eager.databaseFor(directory)->canonical("image/jpg"), "image/jpg");
}

Value rule(std::initializer_list<value::Dictionary::Entry> entries) {
  return Value::dictionary(value::Dictionary(entries));
}

value::Dictionary items(std::vector<std::string> types) {
  value::Array list;
  for (std::string& type : types) list.push_back(Value::string(std::move(type)));
  return {{"items", Value::array(std::move(list))}};
}

TEST_F(TypeRegistryTest, ActivationRules) {
  const Value one = Value::integer(1), two = Value::integer(2), any = Value::boolean(true);
  struct Case {
    Value rule;
    std::vector<std::string> items;
    bool expected;
  } cases[] = {
      {rule({{"image/*", two}}), {"image/png", "image/jpeg"}, true},
      {rule({{"image/*", two}}), {"image/png", "image/png", "image/gif"}, false},
      {rule({{"image/*", two}}), {}, false},
      {rule({{"image/*", any}}), {"image/a", "image/b", "image/c", "image/d"}, true},
      {rule({{"image/*", any}, {"MaxItems", two}}), {"image/a", "image/b", "image/c"}, false},
      // An item counts against every limit it conforms to.
      {rule({{"image/*", one}, {"text/plain", one}}), {"image/png", "image/svg+xml"}, false},
      {rule({{"image/*", one}, {"text/plain", one}}), {"image/png", "text/x-csrc"}, true},
      {rule({{"image/*", one}, {"text/plain", one}}), {"image/png", "audio/ogg"}, false},
      {rule({{"image/png", one}}), {"IMAGE/PNG", "image/png"}, false},
      {rule({{"image/png", Value::unsignedInteger(2)}}), {"IMAGE/PNG", "image/png"}, true},
      {rule({{"image/png", Value::integer(0)}}), {"image/png"}, false},
      {rule({{"image/png", Value::real(1.0)}}), {"image/png"}, false},
      {rule({{"image/png", one}, {"MaxItems", any}}), {"image/png"}, false},
      {rule({{"MaxItems", one}}), {"image/png"}, false},
      {Value::array({}), {"image/png"}, false},
      // Wildcards: "application/*" is no catch-all, "*/*" is.
      {rule({{"application/*", any}}), {"image/png"}, false},
      {rule({{"application/*", any}}), {"text/xml", "application/pdf"}, true},
      {rule({{"text/*", any}}), {"text/x-csv", "application/x-shellscript"}, false},
      {rule({{"*/*", two}}), {"image/png", "x-unknown/thing"}, true},
      {rule({{"*/*", one}}), {"image/png", "x-unknown/thing"}, false},
      {rule({{"*/*", any}}), {"image/png", "not a type"}, false},
  };
  for (std::size_t i = 0; i < std::size(cases); ++i) {
    EXPECT_EQ(ActivationRule::evaluate(cases[i].rule, items(cases[i].items)), cases[i].expected)
        << "case " << i;
  }
}

TEST_F(TypeRegistryTest, ActivationRuleRefusesMalformedItems) {
  Value accepting = rule({{"image/*", Value::boolean(true)}});
  EXPECT_FALSE(ActivationRule::evaluate(accepting, {}));
  EXPECT_FALSE(ActivationRule::evaluate(accepting, {{"items", Value::string("image/png")}}));
  EXPECT_FALSE(ActivationRule::evaluate(
      accepting, {{"items", Value::array({Value::string("image/png"), Value::integer(3)})}}));
}

}  // namespace
