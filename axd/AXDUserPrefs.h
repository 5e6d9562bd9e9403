#pragma once

#include <optional>
#include <string>

#include "platform/value/Value.h"

// The daemon's preference object: the user's settings of the plug-in framework, kept in the
// preference domain "<vendor prefix>.annexa.userprefs" of the effective user
// (prefs::Preferences). Other programs write the domain; the daemon only reads it.
//
// Thread safety: immutable after construction, so its methods may run on any thread at once;
// Preferences serializes the file reads. The server creates one at construction and keeps it as
// userPrefs.
class AXDUserPrefs {
 public:
  // The object that searches the domain "<vendor prefix>.annexa.userprefs". Reads nothing yet.
  AXDUserPrefs();

  // Synchronizes the domain, then returns its "exclusions" value as of now, so a change written
  // by another program since the last call counts from this call on, without a restart. The
  // value is as the file holds it (meant to be an array of match rules; the caller checks).
  // Nothing when the domain's file is missing, unreadable, not a property list or not a
  // dictionary, or has no "exclusions": then no plug-in is excluded.
  std::optional<value::Value> exclusions() const;

 private:
  std::string domain_;
};
