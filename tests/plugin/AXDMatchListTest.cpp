// One discovery request's match list: which records of one identifier it keeps, in what order,
// and the override links between the kept forms.

#include <gtest/gtest.h>

#include <map>
#include <string>
#include <vector>

#include "Annexa/AXProtocol.h"
#include "axd/AXDMatchList.h"
#include "axd/AXDNames.h"
#include "axd/AXDPlugIn.h"
#include "platform/value/CborCodec.h"
#include "tests/platform/ScopedEnvironment.h"
#include "tests/plugin/RegistryRecords.h"

namespace {

using namespace records;
using registrum::PlugInRecord;
using value::Value;

constexpr std::uint64_t kVersions = AXProtocol::kDiscoverAllVersions;

struct Copy {
  std::string identifier = "t";
  std::optional<std::string> version = "1.9";
  bool system = false;
  double modified = 0;
  std::optional<Value> replaces;
};

class AXDMatchListTest : public ::testing::Test {
 protected:
  void SetUp() override { environment_.unset("ANNEXA_ROOT"); }

  // A record on the system volume, or in an application, with the facts of |copy|.
  static std::shared_ptr<AXDPlugIn> record(const Copy& copy) {
    PlugInRecord::Fields fields =
        plugIn(copy.system ? "/System/Library/" + copy.identifier + ".appex"
                           : "/Apps/Host.app/PlugIns/Tool.appex");
    if (!copy.system) fields.containingApplication = application("/Apps/Host.app");
    fields.plugInIdentifier = copy.identifier;
    fields.onSystemPartition = copy.system;
    fields.registrationDate = copy.modified;
    value::Dictionary attributes;
    if (copy.version) attributes = {{"QSExtensionVersion", S(*copy.version)}};
    fields.plugInDictionary =
        fields.plugInDictionary.with("QSExtensionAttributes", Value::dictionary(attributes));
    if (copy.replaces) {
      fields.entitlements = {{AXDNames::kReplacePlugInEntitlement, *copy.replaces}};
    }
    auto built = build(std::move(fields));
    EXPECT_TRUE(built);
    return built;
  }

  // The forms that a request with |flags| keeps of |copies|, offered in order, as the list
  // writes them; |labels| gets the index of each form's copy.
  static value::Array discover(std::uint64_t flags, const std::vector<Copy>& copies,
                               std::vector<std::int64_t>* labels = nullptr) {
    auto offered = std::make_shared<AXDMatchList::Records>();
    std::map<std::string, std::int64_t> labelOfUuid;
    for (std::size_t i = 0; i < copies.size(); ++i) {
      offered->push_back(record(copies[i]));
      labelOfUuid[offered->back()->uuid()->string()] = static_cast<std::int64_t>(i);
    }
    AXDMatchList list(flags, nullptr, offered);
    for (const auto& plugIn : *offered) {
      if (list.admit(*plugIn)) list.append(*plugIn, Value::dictionary({}));
    }
    auto decoded = value::CborCodec::decode(written(list));
    const Value* carried = decoded.ok() ? decoded.value().asEnvelope() : nullptr;
    EXPECT_TRUE(carried && carried->asArray());
    if (!carried || !carried->asArray()) return {};
    value::Array forms = *carried->asArray();
    for (const Value& form : forms) {
      if (labels) labels->push_back(labelOfUuid[*form.asDictionary()->find("uuid")->asString()]);
    }
    return forms;
  }

  // Every part of the finished |list|, which must come to the size it announced.
  static std::vector<std::uint8_t> written(AXDMatchList& list) {
    list.finish();
    std::vector<std::uint8_t> bytes;
    for (std::size_t part = 0; part < list.parts(); ++part) list.writePart(part, bytes);
    EXPECT_EQ(bytes.size(), list.size());
    return bytes;
  }

  static std::vector<std::int64_t> labels(std::uint64_t flags, const std::vector<Copy>& copies) {
    std::vector<std::int64_t> kept;
    discover(flags, copies, &kept);
    return kept;
  }

  ScopedEnvironment environment_;
};

using Labels = std::vector<std::int64_t>;

TEST_F(AXDMatchListTest, CopiesOfOneVersionPreferTheSystemThenTheLaterTime) {
  const struct {
    Copy first, second;
    Labels expected;
  } cases[] = {
      {{.modified = 5}, {.system = true, .modified = 1}, {1}},
      {{.system = true, .modified = 1}, {.modified = 5}, {1}},
      {{.system = true, .modified = 5}, {.modified = 1}, {0}},
      {{.system = true, .modified = 1}, {.modified = 1}, {0}},
      {{.system = true, .modified = 1}, {.system = true, .modified = 5}, {1}},
      {{.modified = -5}, {.modified = -1}, {1}},
  };
  for (std::size_t i = 0; i < std::size(cases); ++i) {
    EXPECT_EQ(labels(0, {cases[i].first, cases[i].second}), cases[i].expected) << "case " << i;
  }
}

TEST_F(AXDMatchListTest, AReplacementGoesToTheEndAndTheReplacedLeavesItsPlace) {
  EXPECT_EQ(labels(0, {{.identifier = "a"},
                       {.identifier = "b"},
                       {.identifier = "c"},
                       {.identifier = "a", .version = "2"}}),
            (Labels{1, 2, 3}));
  // The walk passes other versions to reach the copy of the same version.
  EXPECT_EQ(labels(kVersions, {{.version = "1"},
                               {.version = "2"},
                               {.identifier = "b"},
                               {.version = "2", .modified = 1},
                               {.version = "2"}}),
            (Labels{0, 2, 3}));
}

TEST_F(AXDMatchListTest, OverridesLinkTheReplacedAndTheReplacing) {
  value::Array forms =
      discover(0, {
                      {.identifier = "a"},
                      {.identifier = "b"},
                      {.identifier = "c"},
                      {.identifier = "r1", .replaces = S("a")},
                      {.identifier = "r2", .replaces = A({S("b"), Value::integer(1), S("c")})},
                      {.identifier = "r3", .replaces = S("a")},
                      {.identifier = "r4", .replaces = Value::integer(1)},
                      {.identifier = "r5", .replaces = S("absent")},
                  });
  ASSERT_EQ(forms.size(), 8u);
  auto field = [&](std::size_t i, const char* key) {
    const Value* found = forms[i].asDictionary()->find(key);
    return found ? found->description() : "none";
  };
  auto uuidOf = [&](std::size_t i) { return field(i, "uuid"); };
  EXPECT_EQ(field(0, "overrider"), uuidOf(5));  // the later claim on "a" wins
  EXPECT_EQ(field(1, "overrider"), uuidOf(4));
  EXPECT_EQ(field(2, "overrider"), uuidOf(4));
  EXPECT_EQ(field(5, "overriding"), S("a").description());
  EXPECT_EQ(field(4, "overriding"), S("c").description());  // the last one it replaced
  for (std::size_t i : {3u, 6u, 7u}) {
    EXPECT_EQ(field(i, "overriding"), "none") << i;
    EXPECT_EQ(field(i, "overrider"), "none") << i;
  }
}

// The forms go out as each plug-in keeps them encoded; the bytes must be those of the form
// built as a value, with its annotation and override links, encoded whole.
TEST_F(AXDMatchListTest, WritesEachFormAsItsValueEncodes) {
  auto plugIns = std::make_shared<AXDMatchList::Records>(
      AXDMatchList::Records{record({.identifier = "a"}), record({.identifier = "b"}),
                            record({.identifier = "r", .replaces = S("a")})});
  const value::Dictionary annotation{{"election", Value::integer(1)}};
  AXDMatchList list(0, std::make_shared<const std::string>(32, 'k'), plugIns);
  for (const auto& plugIn : *plugIns) {
    ASSERT_TRUE(list.admit(*plugIn));
    list.append(*plugIn, Value::dictionary(annotation));
  }

  auto form = [&](std::size_t i) {
    const AXDPlugIn& plugIn = *(*plugIns)[i];
    return plugIn.augmentForm(plugIn.exportForm(), std::string(32, 'k'))
        .with("annotations", Value::dictionary(annotation));
  };
  value::Array expected = {
      Value::dictionary(form(0).with("overrider", S((*plugIns)[2]->uuid()->string()))),
      Value::dictionary(form(1)), Value::dictionary(form(2).with("overriding", S("a")))};
  std::vector<std::uint8_t> encoded;
  value::CborCodec::encode(Value::envelope(Value::array(expected)), encoded);
  EXPECT_EQ(written(list), encoded);
}

}  // namespace
