#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/value/Dictionary.h"
#include "platform/value/Value.h"

// The election restriction of a discovery rule: its "QSUserElection" entry as a list of election
// texts, each the decimal form of an election's low 8 bits ("1", "255"). A candidate passes when
// its own election text is one of them. Immutable; safe to share between threads.
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
  // annotation's numeric "election" reduced to its low 8 bits, in decimal. Without a numeric
  // election: "1" when the auto-elect entitlement is a true boolean or a non-zero number,
  // else "0".
  static std::string electionText(const std::optional<value::Dictionary>& annotation,
                                  const value::Dictionary& entitlements);

  // True when |text| equals one of the restriction's texts exactly.
  bool accepts(const std::string& text) const;

  const std::vector<std::string>& elections() const { return elections_; }

 private:
  explicit AXDElectionFilter(std::vector<std::string> elections)
      : elections_(std::move(elections)) {}

  std::vector<std::string> elections_;
};
