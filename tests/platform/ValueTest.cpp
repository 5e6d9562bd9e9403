#include <gtest/gtest.h>

#include "platform/os/Format.h"
#include "platform/value/Value.h"

namespace {

using value::Dictionary;
using value::Value;

TEST(ValueTest, DictionaryChangesMakeNewDictionaries) {
  Dictionary a{{"a", Value::integer(1)}};
  Dictionary b = a.with("b", Value::integer(2));
  EXPECT_EQ(a.size(), 1u);
  EXPECT_EQ(b.size(), 2u);
  EXPECT_TRUE(a.without("a").empty());
  EXPECT_EQ(*b.find("b"), Value::integer(2));
  EXPECT_EQ(b.find("c"), nullptr);
}

TEST(ValueTest, EnumerationIsSortedByKey) {
  Dictionary d{{"zeta", Value()}, {"alpha", Value()}, {"mid", Value()}};
  std::string keys;
  for (const auto& [key, v] : d) keys += key + ",";
  EXPECT_EQ(keys, "alpha,mid,zeta,");
}

TEST(ValueTest, IntegersOfEitherKindCompareByValue) {
  EXPECT_EQ(Value::integer(5), Value::unsignedInteger(5));
  EXPECT_NE(Value::integer(-1), Value::unsignedInteger(UINT64_MAX));
  EXPECT_NE(Value::integer(1), Value::real(1));
  EXPECT_NE(Value::string("1"), Value::integer(1));
}

TEST(ValueTest, TypedReadsRefuseOtherTypes) {
  Value s = Value::string("x");
  EXPECT_EQ(s.asArray(), nullptr);
  EXPECT_FALSE(s.asUInt());
  EXPECT_FALSE(Value::integer(3).asUInt());
  EXPECT_EQ(Value::real(-2.9).integerValue(), -2);
  EXPECT_EQ(Value::boolean(true).integerValue(), 1);
  EXPECT_FALSE(s.integerValue());
}

TEST(ValueTest, UuidTextRoundTrips) {
  value::Uuid u = value::Uuid::random();
  EXPECT_EQ(u.string().size(), 36u);
  EXPECT_EQ(value::Uuid::parse(u.string()), u);
  EXPECT_FALSE(value::Uuid::parse("not-a-uuid"));
}

TEST(FormatTest, PlaceholdersTakeArgumentsInOrder) {
  EXPECT_EQ(os::format("client %d used %u requests so far", {42, 1000u}),
            "client 42 used 1000 requests so far");
  EXPECT_EQ(os::format("bulk options 0x%lx not supported", {std::uint64_t{255}}),
            "bulk options 0xff not supported");
  EXPECT_EQ(os::format("%s and %@ 100%%", {"text", std::string("obj")}), "text and obj 100%");
  EXPECT_EQ(os::format("missing %d", {}), "missing ");
  EXPECT_EQ(os::format("%d", {-1}), "-1");
}

}  // namespace
