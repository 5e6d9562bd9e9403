#include "axd/AXDUserPrefs.h"

#include "platform/prefs/Preferences.h"

AXDUserPrefs::AXDUserPrefs() : domain_(AXD_VENDOR_PREFIX ".annexa.userprefs") {}

std::optional<value::Value> AXDUserPrefs::exclusions() const {
  // Cannot fail: the domain name is valid.
  prefs::Preferences::synchronize(domain_);
  return prefs::Preferences::copyValue("exclusions", domain_);
}
