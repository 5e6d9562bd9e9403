#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <vector>

#include "platform/value/Value.h"
#include "platform/zyn/Frame.h"

// The frames of one discovery round trip as a raw client handles them: the request of
// AXDaemonClient::matchPlugIns byte for byte, and the reading of the daemon's reply frame.
// Stateless; safe from any thread.
class MatchFrames {
 public:
  // The request frame of matchPlugIns(|rule|, |flags|), carrying message id |id|.
  static std::vector<std::uint8_t> request(const std::optional<value::Dictionary>& rule,
                                           std::uint64_t flags, std::uint64_t id);

  // The first frame in |bytes|, when they begin with a whole well-formed one.
  static std::optional<zyn::Frame> decode(std::span<const std::uint8_t> bytes);

  // The number of plug-in forms in |body|, the item of a version-3 match reply; nothing when it
  // is an error or carries no list of forms.
  static std::optional<std::size_t> forms(const value::Value& body);
};
