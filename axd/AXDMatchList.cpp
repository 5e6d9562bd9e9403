#include "axd/AXDMatchList.h"

#include <compare>

#include "Annexa/AXProtocol.h"
#include "Annexa/AXUtilities.h"
#include "platform/os/Log.h"
#include "platform/value/CborCodec.h"

AXDMatchList::AXDMatchList(std::uint64_t flags, AXDPlugIn::SealingKey key,
                           std::shared_ptr<const Records> candidates)
    : flags_(flags), key_(std::move(key)), candidates_(std::move(candidates)) {
  kept_.reserve(candidates_->size());
  byIdentifier_.reserve(candidates_->size());
}

bool AXDMatchList::admit(const AXDPlugIn& plugIn) {
  auto chain = byIdentifier_.find(identifierOf(plugIn));
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

AXDMatchList::Identifier AXDMatchList::identifierOf(const AXDPlugIn& plugIn) {
  return {plugIn.facts().identifierHash, plugIn.facts().identifierText()};
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
  auto form = plugIn.discoveryForm(key_);
  scratch_.clear();
  value::CborCodec::encode(annotation, scratch_);
  std::size_t size = form->sizeWith(scratch_.size());
  kept_.push_back({&plugIn, std::move(form), size, std::move(annotation)});
  Chain& chain = byIdentifier_[identifierOf(plugIn)];
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

void AXDMatchList::finish() {
  linkOverrides();
  for (std::size_t at = 0; at < kept_.size(); ++at) {
    Kept& kept = kept_[at];
    if (kept.removed) continue;
    live_.push_back(at);
    if (kept.overrider || kept.overriding) {
      kept.changed = changedForm(kept);
      size_ += kept.changed.size();
      continue;
    }
    size_ += kept.size;
  }
  std::vector<std::uint8_t> scratch;
  writeHead(scratch);
  size_ += scratch.size();
}

void AXDMatchList::linkOverrides() {
  if (overrides_.empty()) return;
  for (Kept& kept : kept_) {
    if (kept.removed) continue;
    const std::string& identifier = kept.plugIn->facts().identifierText();
    auto entry = overrides_.find(identifier);
    if (entry == overrides_.end()) continue;
    Kept& replacing = kept_[entry->second];
    if (std::optional<value::Uuid> uuid = replacing.plugIn->uuid()) {
      kept.overrider = value::Value::string(uuid->string());
    }
    replacing.overriding = identifier;
  }
}

std::vector<std::uint8_t> AXDMatchList::changedForm(const Kept& kept) const {
  // Rare enough to go through values: the kept form decoded, the links added, encoded again.
  std::vector<std::uint8_t> encoded;
  kept.form->encodeWith(kept.annotation, encoded);
  os::Result<value::Value> decoded = value::CborCodec::decode(encoded);
  if (!decoded.ok() || !decoded.value().asDictionary()) {
    os::Log::notice("cannot link overrides of plug-in %@: its form does not decode",
                    {kept.plugIn->facts().identifierText()});
    return encoded;
  }
  value::Dictionary form = *decoded.value().asDictionary();
  if (kept.overrider) form = form.with("overrider", *kept.overrider);
  if (kept.overriding) form = form.with("overriding", value::Value::string(*kept.overriding));
  encoded.clear();
  value::CborCodec::encode(value::Value::dictionary(form), encoded);
  return encoded;
}

void AXDMatchList::writeHead(std::vector<std::uint8_t>& out) const {
  value::CborCodec::encodeTag(value::CborCodec::kTagEnvelope, out);
  value::CborCodec::encodeArrayHead(live_.size(), out);
}

void AXDMatchList::writePart(std::size_t part, std::vector<std::uint8_t>& out) const {
  if (part == 0) return writeHead(out);
  const Kept& kept = kept_[live_[part - 1]];
  if (!kept.changed.empty()) {
    out.insert(out.end(), kept.changed.begin(), kept.changed.end());
    return;
  }
  kept.form->encodeWith(kept.annotation, out);
}
