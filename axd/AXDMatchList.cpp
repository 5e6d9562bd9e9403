#include "axd/AXDMatchList.h"

#include <compare>

#include "Annexa/AXProtocol.h"
#include "Annexa/AXUtilities.h"
#include "axd/AXDNames.h"
#include "axd/AXDPlugIn.h"

namespace {

std::string textField(const value::Dictionary& form, const char* key) {
  const value::Value* field = form.find(key);
  return field && field->asString() ? *field->asString() : std::string();
}

std::int64_t integerField(const value::Dictionary& form, const char* key) {
  const value::Value* field = form.find(key);
  return field ? field->integerValue().value_or(0) : 0;
}

}  // namespace

bool AXDMatchList::admit(const AXDPlugIn& plugIn) {
  auto group = byIdentifier_.find(plugIn.identifier().value_or(""));
  if (group == byIdentifier_.end()) return true;
  std::vector<Kept>& kept = group->second;
  for (auto it = kept.begin(); it != kept.end(); ++it) {
    std::optional<bool> replaces = decide(plugIn, *it->form);
    if (!replaces) continue;
    if (*replaces) {
      forms_[it->position] = nullptr;
      kept.erase(it);
    }
    return *replaces;
  }
  return true;
}

std::optional<bool> AXDMatchList::decide(const AXDPlugIn& plugIn,
                                         const value::Dictionary& existing) const {
  std::strong_ordering order =
      compareVersionString(plugIn.version().value_or(""), textField(existing, "version"));
  bool allVersions = flags_ & AXProtocol::kDiscoverAllVersions;
  bool allCopies = allVersions && (flags_ & AXProtocol::kDiscoverAllCopies);
  if (order != 0) {
    if (allVersions) return std::nullopt;
    return order > 0;
  }
  if (allCopies) return std::nullopt;
  return prefersNew(plugIn, existing);
}

bool AXDMatchList::prefersNew(const AXDPlugIn& plugIn, const value::Dictionary& existing) {
  const value::Value* resident = existing.find("systemResident");
  bool existingOnSystem = resident && resident->asBool() == std::optional<bool>(true);
  if (plugIn.onSystemVolume() && !existingOnSystem) return true;
  return plugIn.lastModified() > integerField(existing, "lastmodified");
}

void AXDMatchList::append(value::Dictionary form, const AXDPlugIn& plugIn) {
  Form kept = std::make_shared<value::Dictionary>(std::move(form));
  byIdentifier_[plugIn.identifier().value_or("")].push_back({kept, forms_.size()});
  forms_.push_back(kept);
  std::optional<value::Value> replaced =
      plugIn.valueForEntitlement(AXDNames::kReplacePlugInEntitlement);
  if (!replaced) return;
  if (const std::string* identifier = replaced->asString()) overrides_[*identifier] = kept;
  if (const value::Array* identifiers = replaced->asArray()) {
    for (const value::Value& element : *identifiers) {
      if (const std::string* identifier = element.asString()) overrides_[*identifier] = kept;
    }
  }
}

value::Array AXDMatchList::finish() {
  for (const Form& form : forms_) {
    if (!form) continue;
    std::string identifier = textField(*form, "identifier");
    auto entry = overrides_.find(identifier);
    if (entry == overrides_.end()) continue;
    const Form& replacing = entry->second;
    if (const value::Value* uuid = replacing->find("uuid")) *form = form->with("overrider", *uuid);
    *replacing = replacing->with("overriding", value::Value::string(identifier));
  }
  value::Array kept;
  for (const Form& form : forms_) {
    if (form) kept.push_back(value::Value::dictionary(*form));
  }
  return kept;
}
