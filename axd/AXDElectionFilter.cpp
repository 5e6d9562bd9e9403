#include "axd/AXDElectionFilter.h"

#include <unicode/uchar.h>
#include <unicode/utf8.h>

#include <algorithm>
#include <cstdint>

#include "Annexa/AXUtilities.h"
#include "axd/AXDNames.h"

namespace {

constexpr const char* kUserElection = "QSUserElection";
constexpr const char* kElection = "election";

// True when |text| begins with a code point of the Unicode categories L, M or N.
bool beginsWithLetterMarkOrDigit(const std::string& text) {
  std::int32_t offset = 0;
  UChar32 first;
  U8_NEXT(text.data(), offset, static_cast<std::int32_t>(text.size()), first);
  if (first < 0) return false;
  return (U_GET_GC_MASK(first) & (U_GC_L_MASK | U_GC_M_MASK | U_GC_N_MASK)) != 0;
}

bool autoElects(const value::Dictionary& entitlements) {
  const value::Value* entitlement = entitlements.find(AXDNames::kAutoElectEntitlement);
  if (!entitlement) return false;
  if (auto flag = entitlement->asBool()) return *flag;
  if (auto real = entitlement->asReal()) return *real != 0;
  return entitlement->isNumber() && entitlement->integerValue() != 0;
}

}  // namespace

std::optional<AXDElectionFilter> AXDElectionFilter::fromRule(const value::Dictionary& rule) {
  const value::Value* entry = rule.find(kUserElection);
  if (!entry) return std::nullopt;
  std::vector<std::string> elections;
  if (const value::Array* patterns = entry->asArray()) {
    for (const value::Value& pattern : *patterns) {
      std::optional<std::string> normalized = normalizedPattern(pattern);
      if (!normalized) return std::nullopt;
      elections.push_back(std::move(*normalized));
    }
  } else if (entry->asString()) {
    std::optional<std::string> normalized = normalizedPattern(*entry);
    if (!normalized) return std::nullopt;
    elections.push_back(std::move(*normalized));
  } else {
    return std::nullopt;
  }
  return AXDElectionFilter(std::move(elections));
}

std::optional<std::string> AXDElectionFilter::normalizedPattern(const value::Value& pattern) {
  const std::string* text = pattern.asString();
  if (!text || text->empty()) return std::nullopt;
  if ((*text)[0] == '=') return text->substr(1);
  if (beginsWithLetterMarkOrDigit(*text)) return *text;
  return std::nullopt;
}

std::string AXDElectionFilter::electionText(const std::optional<value::Dictionary>& annotation,
                                            const value::Dictionary& entitlements) {
  const value::Value* entry = annotation ? annotation->find(kElection) : nullptr;
  std::int64_t election = entry ? entry->integerValue().value_or(0) : 0;
  // Building the record stores election 1 for an auto-electing plug-in without one.
  if (election == 0 && autoElects(entitlements)) election = 1;
  return std::to_string(election & ~std::int64_t{0xFF00});
}

bool AXDElectionFilter::accepts(const std::string& text) const {
  return std::any_of(elections_.begin(), elections_.end(), [&](const std::string& election) {
    return compareVersionString(text, election) == 0;
  });
}
