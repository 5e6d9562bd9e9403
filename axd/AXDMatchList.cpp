#include "axd/AXDMatchList.h"

#include <compare>

#include "Annexa/AXProtocol.h"
#include "Annexa/AXUtilities.h"
#include "axd/AXDPlugIn.h"
#include "platform/value/CborCodec.h"

void AXDMatchList::reserve(std::size_t count) {
  kept_.reserve(count);
  byIdentifier_.reserve(count);
}

bool AXDMatchList::admit(const AXDPlugIn& plugIn) {
  auto chain = byIdentifier_.find(plugIn.facts().identifier);
  if (chain == byIdentifier_.end()) return true;
  for (std::size_t at = chain->second.first, before = kNone; at != kNone;
       before = at, at = kept_[at].next) {
    std::optional<bool> replaces = decide(plugIn, *kept_[at].plugIn);
    if (!replaces) continue;
    if (*replaces) unlink(chain->second, at, before);
    return *replaces;
  }
  return true;
}

void AXDMatchList::unlink(Chain& chain, std::size_t at, std::size_t before) {
  kept_[at].removed = true;
  (before == kNone ? chain.first : kept_[before].next) = kept_[at].next;
  if (chain.last == at) chain.last = before;
}

std::optional<bool> AXDMatchList::decide(const AXDPlugIn& plugIn, const AXDPlugIn& existing) const {
  std::strong_ordering order =
      compareVersionString(plugIn.facts().version, existing.facts().version);
  bool allVersions = flags_ & AXProtocol::kDiscoverAllVersions;
  bool allCopies = allVersions && (flags_ & AXProtocol::kDiscoverAllCopies);
  if (order != 0) {
    if (allVersions) return std::nullopt;
    return order > 0;
  }
  if (allCopies) return std::nullopt;
  return prefersNew(plugIn, existing);
}

bool AXDMatchList::prefersNew(const AXDPlugIn& plugIn, const AXDPlugIn& existing) {
  if (plugIn.facts().onSystemVolume && !existing.facts().onSystemVolume) return true;
  return plugIn.facts().lastModified > existing.facts().lastModified;
}

void AXDMatchList::append(const AXDPlugIn& plugIn, value::Value annotation) {
  const std::size_t position = kept_.size();
  kept_.push_back({&plugIn, plugIn.discoveryForm(key_), std::move(annotation)});
  Chain& chain = byIdentifier_[plugIn.facts().identifier];
  (chain.last == kNone ? chain.first : kept_[chain.last].next) = position;
  chain.last = position;
  const std::optional<value::Value>& replaced = plugIn.facts().replaces;
  if (!replaced) return;
  if (const std::string* identifier = replaced->asString()) overrides_[*identifier] = position;
  if (const value::Array* identifiers = replaced->asArray()) {
    for (const value::Value& element : *identifiers) {
      if (const std::string* identifier = element.asString()) overrides_[*identifier] = position;
    }
  }
}

void AXDMatchList::write(std::vector<std::uint8_t>& out) const {
  std::size_t live = 0;
  for (const Kept& kept : kept_) live += kept.removed ? 0 : 1;
  value::CborCodec::encodeArrayHead(live, out);
  for (const Kept& kept : kept_) {
    if (!kept.removed) writeForm(kept, out);
  }
}

void AXDMatchList::linkOverrides() {
  if (overrides_.empty()) return;
  for (Kept& kept : kept_) {
    if (kept.removed) continue;
    const std::string& identifier = kept.plugIn->facts().identifier;
    auto entry = overrides_.find(identifier);
    if (entry == overrides_.end()) continue;
    Kept& replacing = kept_[entry->second];
    if (std::optional<value::Uuid> uuid = replacing.plugIn->uuid()) {
      kept.overrider = value::Value::string(uuid->string());
    }
    replacing.overriding = identifier;
  }
}

// The form as the plug-in keeps it encoded; one that an override changes is built afresh.
void AXDMatchList::writeForm(const Kept& kept, std::vector<std::uint8_t>& out) const {
  if (!kept.overrider && !kept.overriding) {
    kept.form->encodeWith(kept.annotation, out);
    return;
  }
  std::optional<std::string> key = key_ ? std::optional(*key_) : std::nullopt;
  value::Dictionary form =
      kept.plugIn->augmentForm(kept.plugIn->exportForm(), key).with("annotations", kept.annotation);
  if (kept.overrider) form = form.with("overrider", *kept.overrider);
  if (kept.overriding) form = form.with("overriding", value::Value::string(*kept.overriding));
  value::CborCodec::encode(value::Value::dictionary(form), out);
}
