#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "axd/AXDPlugIn.h"
#include "platform/value/EncodedDictionary.h"
#include "platform/value/Value.h"
#include "platform/zyn/ItemStream.h"

// The plug-ins that one discovery request keeps, in the order it kept them, with their
// annotations and the overrides table; at the end, the reply's list of their forms, written in
// parts as the connection sends it. It collapses the records of one plug-in identifier by the
// request's flags: the highest version wins unless every version is asked for (0x1); among
// records of one version the copy preference decides unless every copy is asked for too (0x1
// with 0x4).
//
// Built on the service queue by one request (admit, append, finish); once finished it is
// immutable and may be written from any thread (zyn::ItemStream).
class AXDMatchList : public zyn::ItemStream {
 public:
  using Records = std::vector<std::shared_ptr<AXDPlugIn>>;

  // A list for a request with |flags| over |candidates|, which it keeps alive: every plug-in
  // given to it is one of them. Forms carry read extensions sealed with |key|
  // (AXDPlugIn::discoveryForm).
  AXDMatchList(std::uint64_t flags, AXDPlugIn::SealingKey key,
               std::shared_ptr<const Records> candidates);

  // Whether |plugIn| is kept against the plug-ins so far. Walks those of the same identifier
  // (exact string equality) in order; every decision other than "keep both" ends the walk. When
  // the new record replaces a kept one, that one is removed and true is returned; false means
  // the record is dropped and nothing changed. A record without a version compares as the empty
  // version, below every other.
  bool admit(const AXDPlugIn& plugIn);

  // Appends |plugIn|, whose form is to carry |annotation| (a dictionary) under "annotations",
  // and records the identifiers that the plug-in's entitlement "<vendor prefix>.developer.
  // replace-plugin" names (a string, or the strings of an array) as replaced by it; a later
  // plug-in naming the same identifier wins.
  void append(const AXDPlugIn& plugIn, value::Value annotation);

  // Ends the list: links overrides (each kept form whose "identifier" was named by an appended
  // plug-in gets "overrider", that plug-in's "uuid", and that plug-in's form gets "overriding",
  // the identifier; a naming plug-in that a later copy replaced still counts, so "overrider" may
  // name a UUID missing from the reply) and sizes the item. Call once, after the last append.
  void finish();

  // The item, once finished: the kept forms in order, as one array inside the property-list
  // envelope the current protocol gives the list. Part 0 is the envelope's tag and the array's
  // head; part N the N-th form.
  std::size_t size() const override { return size_; }
  std::size_t parts() const override { return live_.size() + 1; }
  void writePart(std::size_t part, std::vector<std::uint8_t>& out) const override;

 private:
  static constexpr std::size_t kNone = SIZE_MAX;

  struct Kept {
    const AXDPlugIn* plugIn;
    // The plug-in's kept form, taken while the record is at hand (AXDPlugIn::discoveryForm).
    std::shared_ptr<const value::EncodedDictionary> form;
    // Its size with the annotation, read while the form is at hand.
    std::size_t size = 0;
    value::Value annotation;
    bool removed = false;
    std::size_t next = kNone;  // the next live record of the same identifier
    std::optional<value::Value> overrider;
    std::optional<std::string> overriding;
    // The whole form encoded, for one that an override changes; empty otherwise.
    std::vector<std::uint8_t> changed;
  };

  // The first and last live records of an identifier in kept_, linked through Kept::next in
  // order: the walk for a new record visits only its own identifier's, so a request costs
  // linear time, not quadratic. Keys view the records' own identifiers, hashed when the record
  // was built (AXDPlugIn::Facts), so a new identifier is not read again.
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
  void linkOverrides();
  // The form of |kept| built afresh with its override links, encoded.
  std::vector<std::uint8_t> changedForm(const Kept& kept) const;
  // Appends the envelope's tag and the array's head.
  void writeHead(std::vector<std::uint8_t>& out) const;

  const std::uint64_t flags_;
  const AXDPlugIn::SealingKey key_;
  const std::shared_ptr<const Records> candidates_;
  // Every plug-in in the order it was kept; a removed one stays, marked.
  std::vector<Kept> kept_;
  struct Identifier {
    std::size_t hash;
    std::string_view text;
    bool operator==(const Identifier& other) const {
      return hash == other.hash && text == other.text;
    }
  };
  struct IdentifierHash {
    std::size_t operator()(const Identifier& identifier) const { return identifier.hash; }
  };
  static Identifier identifierOf(const AXDPlugIn& plugIn);
  std::unordered_map<Identifier, Chain, IdentifierHash> byIdentifier_;  // see Chain
  // Replaced identifier -> position in kept_ of the plug-in that names it.
  std::map<std::string, std::size_t> overrides_;
  std::vector<std::uint8_t> scratch_;  // an annotation encoded, to learn its size
  // After finish(): the positions of the live records in kept_, and the item's size.
  std::vector<std::size_t> live_;
  std::size_t size_ = 0;
};
