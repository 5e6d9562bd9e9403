#include <gtest/gtest.h>

#include "platform/os/Format.h"
#include "platform/value/Value.h"

namespace {

using value::Value;

TEST(ValueTest, ComparisonsAndTypedReads) {
  EXPECT_EQ(Value::integer(5), Value::unsignedInteger(5));
  EXPECT_NE(Value::integer(-1), Value::unsignedInteger(UINT64_MAX));
  EXPECT_NE(Value::integer(1), Value::real(1));
  EXPECT_FALSE(Value::integer(3).asUInt());
  EXPECT_EQ(Value::real(-2.9).integerValue(), -2);
  EXPECT_EQ(Value::boolean(true).integerValue(), 1);
  EXPECT_FALSE(Value::string("1").integerValue());
  value::Uuid u = value::Uuid::random();
  EXPECT_EQ(value::Uuid::parse(u.string()), u);
  EXPECT_FALSE(value::Uuid::parse("not-a-uuid"));
}

// The log lines of the daemon that the end-to-end tests read check the common placeholders.
TEST(FormatTest, PlaceholdersTakeArgumentsInOrder) {
  EXPECT_EQ(os::format("%s and %@ 100%%", {"text", std::string("obj")}), "text and obj 100%");
  EXPECT_EQ(os::format("missing %d", {}), "missing ");
  EXPECT_EQ(os::format("%d", {-1}), "-1");
}

}  // namespace
