#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/value/Dictionary.h"
#include "platform/value/Value.h"

// The election restriction of a discovery rule: its "QSUserElection" entry as a list of election
// texts, checked before a candidate's record is built. It must never reject a candidate that the
// rule itself would match, so it reads the election as the rule does (bits 8 to 15 cleared, in
// decimal) and compares as the rule does (numeric-aware equality). Immutable; safe to share
// between threads.
class AXDElectionFilter {
 public:
  // The restriction of |rule|, or nothing when the rule places none: no "QSUserElection" entry,
  // an entry that is neither a string nor an array, or one holding an invalid pattern (an
  // invalid pattern voids the whole entry). An empty array restricts to nothing at all.
  static std::optional<AXDElectionFilter> fromRule(const value::Dictionary& rule);

  // One election pattern normalised: "=<text>" gives <text>; a string whose first character is
  // a Unicode letter, mark or digit gives itself. Nothing for an empty string, a string that
  // begins with any other character, or a value that is not a string.
  static std::optional<std::string> normalizedPattern(const value::Value& pattern);

  // The election text of a candidate with |annotation| and plug-in |entitlements|: the
  // annotation's "election" read as an integer (a number or boolean; anything else is 0) with
  // bits 8 to 15 cleared, in decimal. An election of 0 becomes 1 when the auto-elect entitlement
  // is a true boolean or a non-zero number, as building the record will store.
  static std::string electionText(const std::optional<value::Dictionary>& annotation,
                                  const value::Dictionary& entitlements);

  // True when |text| equals one of the restriction's texts by the numeric-aware comparison.
  bool accepts(const std::string& text) const;

  const std::vector<std::string>& elections() const { return elections_; }

 private:
  explicit AXDElectionFilter(std::vector<std::string> elections)
      : elections_(std::move(elections)) {}

  std::vector<std::string> elections_;
};
