#pragma once

#include <optional>
#include <string>
#include <string_view>

// A file URL ("file:///Apps/Host.app"): the form in which bundle and plug-in locations are
// passed around. Immutable value type.
class AXFileURL {
 public:
  // The URL of an absolute path.
  explicit AXFileURL(std::string path) : path_(std::move(path)) {}

  // Parses "file://" URLs with an empty or "localhost" host; nothing for any other text.
  static std::optional<AXFileURL> fromString(std::string_view text);

  const std::string& path() const { return path_; }
  // The URL text: the path percent-encoded where URL syntax requires.
  std::string string() const;

  bool operator==(const AXFileURL&) const = default;

 private:
  std::string path_;
};
