#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "axd/AXDPlugIn.h"
#include "platform/value/Dictionary.h"
#include "platform/value/Value.h"

// The plug-ins that one discovery request has kept so far, in the order they were kept, with
// their annotations and the overrides table. It collapses the records of one plug-in identifier
// by the request's flags: the highest version wins unless every version is asked for (0x1);
// among records of one version the copy preference decides unless every copy is asked for too
// (0x1 with 0x4). At the end it writes the kept forms.
//
// Not thread-safe: it lives for one request, on the service queue. The plug-ins given to it
// must outlive it.
class AXDMatchList {
 public:
  // A list for a request with |flags| whose forms carry read extensions sealed with |key|
  // (AXDPlugIn::discoveryForm).
  AXDMatchList(std::uint64_t flags, AXDPlugIn::SealingKey key)
      : flags_(flags), key_(std::move(key)) {}

  // Makes room for |count| plug-ins, the candidates of the request.
  void reserve(std::size_t count);

  // Whether |plugIn| is kept against the plug-ins so far. Walks those of the same identifier
  // (exact string equality) in order; every decision other than "keep both" ends the walk. When
  // the new record replaces a kept one, that one is removed and true is returned; false means
  // the record is dropped and nothing changed. A record without a version compares as the empty
  // version, below every other.
  bool admit(const AXDPlugIn& plugIn);

  // Appends |plugIn|, whose form is to carry |annotation| (a dictionary) under "annotations",
  // and records the
  // identifiers that the plug-in's entitlement "<vendor prefix>.developer.replace-plugin" names
  // (a string, or the strings of an array) as replaced by it; a later plug-in naming the same
  // identifier wins.
  void append(const AXDPlugIn& plugIn, value::Value annotation);

  // Links overrides: each kept form whose "identifier" was named by an appended plug-in gets
  // "overrider", that plug-in's "uuid", and that plug-in's form gets "overriding", the
  // identifier. A naming plug-in that a later copy replaced still counts: the overrides table
  // outlives the removal, so "overrider" may name a UUID missing from the reply. Call once,
  // after the last append.
  void linkOverrides();
  // Appends to |out| the kept forms in order as one CBOR array. May be called more than once.
  void write(std::vector<std::uint8_t>& out) const;

 private:
  static constexpr std::size_t kNone = SIZE_MAX;

  struct Kept {
    const AXDPlugIn* plugIn;
    // The plug-in's kept form, taken while the record is at hand (AXDPlugIn::discoveryForm).
    std::shared_ptr<const value::EncodedDictionary> form;
    value::Value annotation;
    bool removed = false;
    std::size_t next = kNone;  // the next live record of the same identifier
    std::optional<value::Value> overrider;
    std::optional<std::string> overriding;
  };

  // The first and last live records of an identifier in kept_, linked through Kept::next in
  // order: the walk for a new record visits only its own identifier's, so a request costs
  // linear time, not quadratic. Keys view the records' own identifiers.
  struct Chain {
    std::size_t first = kNone;
    std::size_t last = kNone;
  };

  // The copy preference between the new record and the kept record |existing| of one version.
  static bool prefersNew(const AXDPlugIn& plugIn, const AXDPlugIn& existing);
  // The decision for one kept record of the same identifier: keep both (nullopt), or whether
  // the new record replaces |existing| (true) or is dropped (false).
  std::optional<bool> decide(const AXDPlugIn& plugIn, const AXDPlugIn& existing) const;
  // Marks the record at |at| removed and takes it out of |chain|; |before| is the record linked
  // to it, or kNone when it is the first.
  void unlink(Chain& chain, std::size_t at, std::size_t before);
  void writeForm(const Kept& kept, std::vector<std::uint8_t>& out) const;

  const std::uint64_t flags_;
  const AXDPlugIn::SealingKey key_;
  // Every plug-in in the order it was kept; a removed one stays, marked.
  std::vector<Kept> kept_;
  std::unordered_map<std::string_view, Chain> byIdentifier_;  // see Chain
  // Replaced identifier -> position in kept_ of the plug-in that names it.
  std::map<std::string, std::size_t> overrides_;
};
