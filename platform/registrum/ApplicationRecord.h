#pragma once

#include <optional>
#include <string>

namespace registrum {

// The registry's record of an application bundle (a directory whose name ends in ".app"), as it
// was when the record was read. Immutable; shared by std::shared_ptr<const ApplicationRecord>
// and safe to read from any thread. Its plug-ins are listed by
// Workspace::plugInsWithinApplication: plug-in records point to their application, so the
// application does not own them.
class ApplicationRecord {
 public:
  struct Fields {
    std::string path;  // canonical path of the bundle directory
    std::optional<std::string> bundleIdentifier;
    std::optional<std::string> bundleVersion;
    std::optional<std::string> localizedName;
    bool placeholder = false;

    bool operator==(const Fields&) const = default;
  };

  explicit ApplicationRecord(Fields fields) : fields_(std::move(fields)) {}

  // The bundle's location: the canonical path of its directory, no trailing slash.
  const std::string& path() const { return fields_.path; }
  // Info.plist's "QFBundleIdentifier" when it is a string; nothing otherwise.
  const std::optional<std::string>& bundleIdentifier() const { return fields_.bundleIdentifier; }
  // Info.plist's "QFBundleShortVersionString" when it is a string; nothing otherwise.
  const std::optional<std::string>& bundleVersion() const { return fields_.bundleVersion; }
  // Info.plist's "QFBundleDisplayName", else "QFBundleName" (strings only); nothing when
  // neither is present.
  const std::optional<std::string>& localizedName() const { return fields_.localizedName; }
  // True while the application is installed as a placeholder (not yet finished): its plug-ins
  // are left out of listings and queries, but are still found by UUID and by path.
  bool isPlaceholder() const { return fields_.placeholder; }

  const Fields& fields() const { return fields_; }

 private:
  const Fields fields_;
};

}  // namespace registrum
