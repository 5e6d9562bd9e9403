#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "platform/value/Value.h"

class AXDPlugIn;

// The forms that one discovery request has kept so far, in the order they were kept, with the
// overrides table. It collapses the records of one plug-in identifier by the request's flags:
// the highest version wins unless every version is asked for (0x1); among records of one
// version the copy preference decides unless every copy is asked for too (0x1 with 0x4).
//
// Not thread-safe: it lives for one request, on the service queue.
class AXDMatchList {
 public:
  explicit AXDMatchList(std::uint64_t flags) : flags_(flags) {}

  // Whether |plugIn| is kept against the forms so far. Walks the forms of the same identifier
  // (exact string equality) in order; every decision other than "keep both" ends the walk. When
  // the new record replaces a form, that form is removed and true is returned; false means the
  // record is dropped and nothing changed. A record or form without a version compares as the
  // empty version, below every other.
  bool admit(const AXDPlugIn& plugIn);

  // Appends |form|, the completed form of |plugIn|, and records the identifiers that the
  // plug-in's entitlement "<vendor prefix>.developer.replace-plugin" names (a string, or the
  // strings of an array) as replaced by it; a later plug-in naming the same identifier wins.
  void append(value::Dictionary form, const AXDPlugIn& plugIn);

  // The kept forms in order, after linking overrides: each form whose "identifier" was named
  // by an appended plug-in gets "overrider", that plug-in's "uuid", and that plug-in's form gets
  // "overriding", the identifier. A naming plug-in whose form a later copy replaced still counts:
  // the overrides table outlives the removal, so "overrider" may name a UUID missing from the
  // reply. Call once, at the end.
  value::Array finish();

 private:
  using Form = std::shared_ptr<value::Dictionary>;
  // A kept form and its place in forms_.
  struct Kept {
    Form form;
    std::size_t position;
  };

  // The copy preference between the new record and the kept form |existing| of one version.
  static bool prefersNew(const AXDPlugIn& plugIn, const value::Dictionary& existing);
  // The decision for one form of the same identifier: keep both (nullopt), or whether the new
  // record replaces |existing| (true) or is dropped (false).
  std::optional<bool> decide(const AXDPlugIn& plugIn, const value::Dictionary& existing) const;

  const std::uint64_t flags_;
  // Every form in the order it was kept; a removed form leaves a null behind.
  std::vector<Form> forms_;
  // The kept forms of each identifier, in the order of forms_: the walk for a new record visits
  // only its own identifier's forms, so a request costs linear time, not quadratic.
  std::unordered_map<std::string, std::vector<Kept>> byIdentifier_;
  std::map<std::string, Form> overrides_;
};
