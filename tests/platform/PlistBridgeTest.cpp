#include <gtest/gtest.h>

#include "platform/value/PlistBridge.h"

namespace {

using value::PlistBridge;
using value::Value;

TEST(PlistBridgeTest, MessageValuesBecomePropertyListValues) {
  value::Uuid uuid = *value::Uuid::parse("00112233-4455-6677-8899-aabbccddeeff");
  Value message = Value::dictionary({
      {"flags", Value::unsignedInteger(3)},
      {"huge", Value::unsignedInteger(UINT64_MAX)},
      {"token", Value::uuid(uuid)},
      {"matches", Value::envelope(Value::array({Value::unsignedInteger(1), Value()}))},
      {"gone", Value()},
      {"keep", Value::array({Value(), Value::string("s"), Value::date({2})})},
  });
  auto plist = PlistBridge::toPlist(message);
  ASSERT_TRUE(plist);
  Value expected = Value::dictionary({
      {"flags", Value::integer(3)},
      {"huge", Value::unsignedInteger(UINT64_MAX)},
      {"token", Value::string("00112233-4455-6677-8899-AABBCCDDEEFF")},
      {"matches", Value::array({Value::integer(1)})},
      {"keep", Value::array({Value::string("s"), Value::date({2})})},
  });
  EXPECT_EQ(*plist, expected);
  const value::Dictionary& d = *plist->asDictionary();
  EXPECT_EQ(d.find("flags")->type(), value::Type::Int);
  EXPECT_EQ(d.find("huge")->type(), value::Type::UInt);
  EXPECT_EQ(d.find("matches")->asArray()->front().type(), value::Type::Int);
  EXPECT_FALSE(PlistBridge::toPlist(Value()));
  EXPECT_FALSE(PlistBridge::toPlist(Value::envelope(Value())));
}

}  // namespace
