// The rule language of the daemon's plug-in record: keys, patterns and operators, on a device
// root with a small type database of its own.

#include <gtest/gtest.h>

#include <cctype>
#include <map>
#include <set>

#include "axd/AXDPlugIn.h"
#include "tests/annexa/LogCapture.h"
#include "tests/plugin/DeviceRoot.h"
#include "tests/plugin/RegistryRecords.h"

namespace {

using namespace records;
using registrum::PlugInRecord;
using value::Dictionary;
using value::Value;

const Value kTrue = Value::boolean(true);
const Value kFalse = Value::boolean(false);
const std::string kUuidText = "6F9619FF-8B86-D011-B42D-00CF4FC964FF";
const std::string kUuidKey = AXD_VENDOR_PREFIX ".uuid";

class AXDPlugInMatchingTest : public DeviceRootTest {
 protected:
  void SetUp() override {
    DeviceRootTest::SetUp();
    directory("usr/share/mime");
    root_.write("usr/share/mime/subclasses", "image/svg+xml application/xml\n");
    app_ = root_ / "Apps/Host.app";
  }

  // A plug-in in an application, or on the system volume outside any when |contained| is false.
  std::shared_ptr<AXDPlugIn> record(Dictionary attributes, bool contained = true) const {
    PlugInRecord::Fields fields =
        plugIn(contained ? app_ + "/PlugIns/Tool.appex" : root_ / "System/Library/Tool.appex");
    fields.uuid = *value::Uuid::parse(kUuidText);
    if (contained) fields.containingApplication = application(app_);
    fields.plugInDictionary =
        fields.plugInDictionary.with("QSExtensionAttributes", Value::dictionary(attributes))
            .with("Dedicated", kFalse)
            .with("Shadow", S("plug-in"));
    fields.infoDictionary =
        fields.infoDictionary.with("InfoOnly", S("raw")).with("Shadow", S("info"));
    fields.entitlements = Dictionary{{"e.string", S("yes")}, {"e.false", kFalse}};
    auto built = build(std::move(fields));
    EXPECT_TRUE(built);
    return built;
  }

  std::string app_;
};

TEST_F(AXDPlugInMatchingTest, KeysNameTheirValues) {
  auto plugIn = record({
      {"QSExtensionVersion", S("2.10")},
      {"Off", kFalse},
      {"Count", Value::integer(3)},
      {"Kinds", A({S("alpha"), Value::integer(7), S("beta")})},
      {"Shadow", S("attribute")},
      {"Rule", D({{"image/*", Value::integer(2)}})},
  });
  std::string lower = kUuidText;
  for (char& c : lower) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
  const struct {
    std::string key;
    Value pattern;
    bool expected;
  } cases[] = {
      {"QSExtensionIdentifier", S(kIdentifier), true},
      {"QSExtensionIdentifier", S("com.example.Tool"), false},
      {kUuidKey, S(kUuidText), true},
      {kUuidKey, S(lower), false},
      {"Missing", kTrue, false},
      {"Missing", kFalse, true},
      {"Missing", S("x"), false},
      {"Off", kFalse, true},
      {"Off", kTrue, false},
      {"Count", kTrue, true},
      {"Count", S("3"), false},
      {"QSExtensionVersion", S(">=2.9"), true},
      {"Kinds", S("beta"), true},
      {"Kinds", A({S("gamma"), S("alpha")}), true},
      {"Kinds", S("7"), false},
      {"InfoOnly", S("raw"), true},
      {"QSExtensionProtocol", S("ToolProtocol"), true},  // the plug-in dictionary's
      {"Dedicated", kFalse, true},
      {"Dedicated", kTrue, false},
      {"Shadow", S("attribute"), true},  // the attribute hides the plug-in dictionary's
      {"Shadow", S("plug-in"), false},
      {"Shadow", S("info"), false},
      {"ENTITLEMENT:e.string", S("yes"), true},
      {"ENTITLEMENT:e.false", kFalse, true},
      {"ENTITLEMENT:Count", kTrue, false},
      {"ENTITLEMENT:", kFalse, true},
      {"QSExtensionContainingApp", S(app_), true},
      {"QSUserElection", S("0"), true},  // no server: never elected
      {"Rule", D({{"items", A({S("image/png"), S("image/svg+xml")})}}), true},
      {"QSExtensionVersion", D({{"items", A({S("image/png")})}}), false},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.key + " " + c.pattern.description());
    EXPECT_EQ(plugIn->matchKey(c.key, c.pattern), c.expected);
    EXPECT_EQ(plugIn->match(Dictionary{{c.key, c.pattern}}), c.expected);
  }
}

TEST_F(AXDPlugInMatchingTest, NoContainingApplicationNeverMatchesThatKey) {
  auto plugIn = record({}, false);
  for (const Value& pattern : {kFalse, kTrue, S(""), S("<>x")}) {
    EXPECT_FALSE(plugIn->matchKey("QSExtensionContainingApp", pattern)) << pattern.description();
  }
}

TEST_F(AXDPlugInMatchingTest, OperatorsAreTriedLongestFirst) {
  auto plugIn = record({});
  // Each operator with a value below, at and above its bound; "9" is above "10" as plain text.
  const struct {
    const char* op;
    bool below, at, above;
  } bounds[] = {
      {"<>", true, false, true}, {"<=", true, true, false}, {">=", false, true, true},
      {"=", false, true, false}, {"<", true, false, false}, {">", false, false, true},
      {"", false, true, false},
  };
  for (const auto& b : bounds) {
    std::string pattern = std::string(b.op) + "10";
    EXPECT_EQ(plugIn->matchValuePattern("9", pattern), b.below) << pattern;
    EXPECT_EQ(plugIn->matchValuePattern("10", pattern), b.at) << pattern;
    EXPECT_EQ(plugIn->matchValuePattern("11", pattern), b.above) << pattern;
  }
  const struct {
    const char* value;
    const char* pattern;
    bool expected;
  } cases[] = {
      {"2.10", ">2.9", true},
      // These three would flip were the operators tried in another order.
      {"3", "<=2", false},
      {"3", ">=3", true},
      {"2", "<>2", false},
      {"<3", "=<3", true},
      {"", "", true},
      {"a", "<b", true},
      {"image/svg+xml", "?UT-CONFORMS:application/xml", true},
      {"application/xml", "?UT-CONFORMS:image/svg+xml", false},
      {"application/xml", "?UT-IS:image/svg+xml", true},
      {"?UT-IS", "?UT-IS", false},  // no operator without its colon
  };
  LogCapture log;
  for (const auto& c : cases) {
    EXPECT_EQ(plugIn->matchValuePattern(c.value, c.pattern), c.expected)
        << c.value << " " << c.pattern;
  }
  EXPECT_NE(log.text().find("unrecognized match operator:?UT-IS\n"), std::string::npos);
  const Value alternatives = A({S("1.0"), Value::integer(2), S(">=3")});
  EXPECT_TRUE(plugIn->matchValuePatterns("1.0", alternatives));
  EXPECT_TRUE(plugIn->matchValuePatterns("3.1", alternatives));
  EXPECT_FALSE(plugIn->matchValuePatterns("2", alternatives));
  EXPECT_FALSE(plugIn->matchValuePatterns("2", A({})));
}

TEST_F(AXDPlugInMatchingTest, EveryPatternKindMeetsEveryValueKind) {
  const Value kinds[] = {
      Value(),
      kTrue,
      Value::integer(0),
      Value::unsignedInteger(1),
      Value::real(1.5),
      S("1"),
      Value::data(value::Data{0x31}),
      Value::date(value::Date{1.0}),
      Value::uuid(value::Uuid()),
      A({Value(), Value::integer(1), A({S("1")}), D({{"1", S("1")}}), S("1")}),
      A({}),
      D({}),
      D({{"items", A({Value::integer(1), S("1")})}, {"1", A({})}}),
  };
  std::map<std::string, Value> attributes;
  for (std::size_t i = 0; i < std::size(kinds); ++i) attributes["K" + std::to_string(i)] = kinds[i];
  auto plugIn = record(Dictionary(attributes));
  std::set<std::string> matchingOne;
  for (const Value& pattern : kinds) {
    for (const auto& entry : attributes) {
      bool matched = plugIn->matchKey(entry.first, pattern);
      if (pattern == S("1") && matched) matchingOne.insert(entry.first);
      // Only booleans, strings, arrays and dictionaries are patterns at all.
      if (pattern.isNull() || pattern.isNumber() || pattern.asData() || pattern.asDate() ||
          pattern.asUuid()) {
        EXPECT_FALSE(matched) << entry.first << " " << pattern.description();
      }
    }
  }
  // Text matches only text: the string itself, or a string element of an array.
  EXPECT_EQ(matchingOne, (std::set<std::string>{"K5", "K9"}));
}

}  // namespace
