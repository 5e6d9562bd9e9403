#pragma once

#include <optional>
#include <string>
#include <vector>

namespace consent {

// The privacy-consent store: which services the user has granted to which application. It is
// the property-list file <root>/var/db/consent.plist, written by the settings program, a
// dictionary from bundle identifier to an array of dictionaries, each with "Service" (string,
// the service identifier) and "Granted" (boolean).
//
// Stateless: every call reads the file afresh, so a change is seen at the next call. Safe to call
// from any thread.
class ConsentStore {
 public:
  struct Entry {
    std::string service;
    std::optional<bool> granted;  // Nothing when "Granted" is missing or not a boolean.
  };

  // The entries of |bundleIdentifier|, in the file's order. An empty list when the file does
  // not exist or does not mention the bundle: nothing was ever granted, which is no failure.
  // Elements that are not dictionaries or lack a string "Service" are skipped. Nothing when the
  // file cannot be read, is not a property list or not a dictionary, or the bundle's entry is
  // not an array; the reason is logged.
  static std::optional<std::vector<Entry>> informationForBundle(
      const std::string& bundleIdentifier);
};

}  // namespace consent
