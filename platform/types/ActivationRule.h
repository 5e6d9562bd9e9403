#pragma once

#include "platform/value/Dictionary.h"
#include "platform/value/Value.h"

namespace types {

// The activation-rule evaluator: does a plug-in's activation rule accept the items a host
// offers? Stateless apart from the type database (see TypeRegistry); safe to call from any
// thread.
//
// A rule is a dictionary from type identifiers (wildcards "major/*" and "*/*" allowed) to the most
// items conforming to that type the plug-in accepts: a positive integer, or the boolean true for
// any number. The optional key "MaxItems" (a positive integer) caps the number of items in total.
// The host's items are a dictionary whose "items" is an array of type identifiers, one per item;
// its other keys are ignored.
class ActivationRule {
 public:
  // True when |rule| accepts |items|: there is at least one item and no more than "MaxItems"
  // (when given); every item conforms (TypeRegistry::conforms) to at least one type of the rule;
  // and no type of the rule is conformed to by more items than its count. An item may count
  // against several types of the rule. False for everything else, including input of the wrong
  // shape: a rule that is no dictionary, a count that is 0, negative, a real, false or of another
  // kind, items missing or not an array, an item that is not a string. Never fails otherwise.
  static bool evaluate(const value::Value& rule, const value::Dictionary& items);
};

}  // namespace types
