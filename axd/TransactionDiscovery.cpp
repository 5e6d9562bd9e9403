// The discovery request: match.

#include "Annexa/AXDaemonClient.h"
#include "Annexa/AXProtocol.h"
#include "axd/AXDMatchList.h"
#include "axd/AXDNames.h"
#include "axd/AXDPlugInHold.h"
#include "axd/AXDServer.h"
#include "axd/AXDZynClient.h"
#include "axd/Transaction.h"
#include "platform/os/Probes.h"
#include "platform/sandbox/BootKey.h"
#include "platform/sandbox/Sandbox.h"

void Transaction::matchPlugIns() {
  Discovery discovery;
  if (const value::Value* rules = request_.find(AXProtocol::kRules)) {
    if (!rules->asDictionary()) {
      fail(AXProtocol::kMalformedRequest, "invalid request format (bad rules dictionary)");
      return;
    }
    discovery.rule = *rules->asDictionary();
  }
  discovery.flags = integerField(AXProtocol::kFlags);
  discovery.all = discovery.flags & AXProtocol::AXDiscoverAll;
  if (discovery.all && !mayDiscoverAll()) {
    fail(AXProtocol::kNotEntitled, "unauthorized discovery flag (AXDiscoverAll)");
    return;
  }
  discovery.exclusions = server()->userPrefs().exclusions();
  discovery.holds = server()->holds();
  discovery.annotations = server()->annotationTable();
  discovery.key = bootKey();
  // A registry that cannot answer leaves nothing to discover; findPlugIns has logged why.
  std::shared_ptr<const AXDatabase::PlugIns> candidates = server()->findPlugIns(discovery.rule);
  if (!candidates) candidates = std::make_shared<const AXDatabase::PlugIns>();
  os::Probes::discoverRaw(static_cast<unsigned>(candidates->size()));
  auto matches = std::make_shared<AXDMatchList>(discovery.flags, discovery.key, candidates);
  for (const auto& plugIn : *candidates) considerCandidate(*plugIn, discovery, *matches);
  // The forms go out as the plug-ins keep them encoded, a piece at a time as the client reads,
  // inside the envelope that AXDaemonClient::convertToZyn gives the list; older protocol
  // versions get no list.
  if (version_ == AXProtocol::kCurrentVersion) {
    matches->finish();
    reply_.setStreamed(AXProtocol::kMatches, std::move(matches));
  }
  done();
}

AXDPlugIn::SealingKey Transaction::bootKey() {
  os::Result<std::string> key = sandbox::BootKey::load();
  if (key.ok()) return server()->sealingKey(std::move(key).value());
  server()->log("cannot read the key of read extensions: %@", {key.error().message});
  return nullptr;
}

bool Transaction::mayDiscoverAll() {
  if (!client_->hasEntitlement(AXDNames::kManagerEntitlement)) return false;
  os::Result<bool> sandboxed = sandbox::Sandbox::isSandboxed(client_->pid());
  if (!sandboxed.ok()) {
    server()->debug("client %d: cannot tell whether it is sandboxed: %@",
                    {client_->pid(), sandboxed.error().message});
    return false;
  }
  return !sandboxed.value();
}

void Transaction::considerCandidate(const AXDPlugIn& plugIn, const Discovery& discovery,
                                    AXDMatchList& matches) {
  if (!discovery.all && hiddenFromClient(plugIn, discovery)) return;
  if (!plugIn.match(discovery.rule)) return;
  if (excluded(plugIn, discovery)) return;
  if (!discovery.all) {
    if (std::optional<std::string> refusal = plugIn.allowForClient(*client_)) {
      server()->debug("client %d cannot use plugin %@: %@",
                      {client_->pid(), plugIn.facts().identifierText(), *refusal});
      return;
    }
  }
  // Exporting cannot fail, so the cheaper deduplication goes first.
  if (!matches.admit(plugIn)) return;
  const value::Value* annotation = discovery.annotations.find(plugIn.annotationKey());
  static const value::Value kNoAnnotation = value::Value::dictionary({});
  matches.append(plugIn, annotation && annotation->asDictionary() ? *annotation : kNoAnnotation);
}

bool Transaction::hiddenFromClient(const AXDPlugIn& plugIn, const Discovery& discovery) {
  const AXDPlugIn::Facts& facts = plugIn.facts();
  if (!facts.onSystemVolume) {
    if (!facts.contained) return true;
    if (discovery.flags & AXProtocol::kDiscoverSystemOnly) return true;
  }
  if (facts.dedicated) {
    const std::shared_ptr<AXBundle>& bundle = client_->bundle();
    std::optional<std::string> plugIns = bundle ? bundle->plugInsPath() : std::nullopt;
    if (!plugIns || !plugIn.path().starts_with(*plugIns + "/")) return true;
  }
  for (const auto& hold : discovery.holds) {
    if (hold->blocks(plugIn)) return true;
  }
  return false;
}

bool Transaction::excluded(const AXDPlugIn& plugIn, const Discovery& discovery) {
  const value::Array* rules = discovery.exclusions ? discovery.exclusions->asArray() : nullptr;
  if (!rules) return false;
  for (const value::Value& rule : *rules) {
    // A rule that is no dictionary names nothing to exclude.
    const value::Dictionary* entries = rule.asDictionary();
    if (!entries || !plugIn.match(*entries)) continue;
    server()->debug("client %d plugin %@ excluded",
                    {client_->pid(), plugIn.identifier().value_or("(null)")});
    return true;
  }
  return false;
}
