#pragma once

#include <array>
#include <cstdint>
#include <string>

#include "Annexa/AXFileURL.h"

// The code identity of a plug-in bundle: a code-directory hash and a requirement text. This
// platform has no code directories, so every signature carries a fresh, unique hash. Not
// synchronised: share it only to read.
class AXDPlugInSignature {
 public:
  using CDHash = std::array<std::uint8_t, 20>;

  // Never fails; |url| is not read.
  explicit AXDPlugInSignature(const AXFileURL& url);

  const CDHash& cdhash() const { return cdhash_; }
  void setCdhash(const CDHash& cdhash) { cdhash_ = cdhash; }
  const std::string& requirement() const { return requirement_; }
  void setRequirement(std::string requirement) { requirement_ = std::move(requirement); }

 private:
  CDHash cdhash_;
  std::string requirement_;
};
