#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/value/Value.h"

// How a plug-in's manifest is completed by the SDK dictionary of its extension point. Pure
// functions over immutable values: no input is changed, nothing is logged, nothing fails, and
// every function is safe to call from any thread.
namespace sdk {

// The manifest side |manifestSide| completed by the SDK side |sdkSide|, at every depth:
//  - a key only the SDK has is copied whole (a dictionary too, unmerged);
//  - "CleanTimeout" takes the SDK's value (sdkOverridesKey);
//  - "Shared" becomes mergeSharedResources(SDK's, manifest's);
//  - a dictionary on both sides is merged key by key with these same rules;
//  - otherwise the manifest's value stays. In particular, when the SDK's value is a dictionary
//    and the manifest's is not, the manifest's value is kept.
// Keys only the manifest has stay.
value::Dictionary mergeDictionary(const value::Dictionary& sdkSide,
                                  const value::Dictionary& manifestSide);

// True only for "CleanTimeout", the one key whose SDK value replaces the manifest's.
bool sdkOverridesKey(std::string_view key);

// The union of two resource lists as an array: the SDK's elements first, then the manifest's
// elements that are new, each in its own order, duplicates (by value equality) removed. A single
// string on either side counts as the one-element list of it; any other non-array value (or
// null) counts as the empty list. Elements that are not strings are kept as they are.
value::Value mergeSharedResources(const value::Value& sdkSide, const value::Value& manifestSide);

// A plug-in version as text: a string is itself; a number is its decimal text ("2", "1.5"), since
// manifests written by hand often say <integer>2</integer>. Nothing for any other value.
std::optional<std::string> versionText(const value::Value& version);

// |info| with its plug-in dictionary ("QSExtension") given an attributes dictionary
// ("QSExtensionAttributes"; a missing or non-dictionary one becomes empty) that holds a
// "QSExtensionVersion" string: the attributes' own (a number becomes its versionText), else
// |info|'s "QFBundleShortVersionString" when it is a string, else "1". A version of any other
// type is left as it is. |info| is returned unchanged when its "QSExtension" is no dictionary.
value::Dictionary canonicalize(const value::Dictionary& info);

}  // namespace sdk
