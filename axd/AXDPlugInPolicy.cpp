// The access policy of a plug-in record: which hosts may use it, and which consent services its
// application was granted.

#include "Annexa/AXBundle.h"
#include "axd/AXDNames.h"
#include "axd/AXDPlugIn.h"
#include "axd/AXDZynClient.h"
#include "platform/consent/ConsentStore.h"
#include "platform/os/Format.h"
#include "platform/os/Log.h"

std::optional<std::string> AXDPlugIn::allowForClient(const AXDZynClient& client) const {
  if (auto restriction = client.entitlementValueForKey(AXDNames::kAllowedPlugInsEntitlement)) {
    const value::Dictionary* rule = restriction->asDictionary();
    if (!rule) return "invalid host restriction entitlement";
    if (!match(*rule)) return "the host's plug-in entitlement does not allow this plug-in";
  }
  const std::optional<std::string>& demanded = hostEntitlementDemand();
  if (!demanded) return std::nullopt;
  // A demand that names no entitlement cannot be met: it must not read as no demand at all.
  if (demanded->empty()) return "the plug-in's host entitlement demand is malformed";
  if (!client.hasEntitlement(*demanded)) {
    return os::format("the host does not have the \"%@\" entitlement", {*demanded});
  }
  return std::nullopt;
}

std::set<std::string> AXDPlugIn::allowedPCXServices() const {
  std::set<std::string> granted;
  std::optional<AXFileURL> containing = containingUrl();
  if (!containing) return granted;
  // A fresh bundle object reads Info.plist anew, so there is no cached information to drop.
  std::shared_ptr<AXBundle> bundle = AXBundle::initWithURL(*containing);
  if (!bundle->path()) {
    os::Log::notice("failed to create bundle for %@", {path()});
    return granted;
  }
  std::optional<std::string> identifier = bundle->bundleIdentifier();
  auto entries =
      identifier ? consent::ConsentStore::informationForBundle(*identifier) : std::nullopt;
  if (!entries) {
    os::Log::notice("PCXAccessCopyInformationForBundle failed for %@",
                    {bundle->bundle()->description()});
    return granted;
  }
  for (const consent::ConsentStore::Entry& entry : *entries) {
    if (entry.granted == true) granted.insert(entry.service);
  }
  return granted;
}
