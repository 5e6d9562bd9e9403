// The election restriction: pattern normalisation and the election text of a candidate.

#include <gtest/gtest.h>

#include "axd/AXDElectionFilter.h"
#include "axd/AXDNames.h"

namespace {

using value::Dictionary;
using value::Value;

TEST(AXDElectionFilterTest, PatternsAreNormalisedByTheirFirstCharacter) {
  struct Case {
    Value pattern;
    std::optional<std::string> expected;
  } cases[] = {
      {Value::string("=1"), "1"},
      {Value::string("="), ""},
      {Value::string("01"), "01"},
      {Value::string("é"), "é"},
      {Value::string("\u0301x"), "\u0301x"},  // a mark
      {Value::string("٣"), "٣"},
      {Value::string("-1"), std::nullopt},
      {Value::string(""), std::nullopt},
      {Value::string("€1"), std::nullopt},
      {Value::integer(1), std::nullopt},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.pattern.description());
    EXPECT_EQ(AXDElectionFilter::normalizedPattern(c.pattern), c.expected);
  }
}

// The filter runs before the rule: any election the rule would match must pass it.
TEST(AXDElectionFilterTest, TheElectionTextIsWhatTheRuleReads) {
  const Dictionary none;
  auto elected = [](Value election) { return Dictionary{{"election", election}}; };
  auto entitled = [](Value value) { return Dictionary{{AXDNames::kAutoElectEntitlement, value}}; };
  struct Case {
    std::optional<Dictionary> annotation;
    Dictionary entitlements;
    std::string expected;
  } cases[] = {
      {elected(Value::integer(1)), none, "1"},
      {elected(Value::integer(257)), none, "1"},
      {elected(Value::integer(65537)), none, "65537"},
      {elected(Value::integer(-1)), none, "-65281"},
      {elected(Value::real(2.7)), none, "2"},
      {elected(Value::boolean(true)), none, "1"},
      {elected(Value::string("1")), none, "0"},
      {elected(Value::integer(0)), entitled(Value::boolean(true)), "1"},
      {std::nullopt, entitled(Value::boolean(true)), "1"},
      {std::nullopt, entitled(Value::integer(2)), "1"},
      {std::nullopt, entitled(Value::string("yes")), "0"},
      {Dictionary{{"extension", Value::dictionary({})}}, none, "0"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.expected);
    EXPECT_EQ(AXDElectionFilter::electionText(c.annotation, c.entitlements), c.expected);
  }
  std::optional<AXDElectionFilter> leadingZero = AXDElectionFilter::fromRule(
      Dictionary{{"QSUserElection", Value::array({Value::string("01")})}});
  ASSERT_TRUE(leadingZero);
  EXPECT_TRUE(leadingZero->accepts("1"));
}

}  // namespace
