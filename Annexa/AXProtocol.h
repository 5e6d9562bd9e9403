#pragma once

// The daemon's wire protocol in one place: the request envelope, the field names, the versions,
// the flags and the error codes. Both ends use these names; docs/wire-protocol.md describes them.

#include <cstddef>
#include <cstdint>

#include "platform/value/Value.h"

namespace AXProtocol {

// Versions: the daemon serves both; they differ only in how a discovery reply carries "matches".
inline constexpr std::uint64_t kCurrentVersion = 3;
inline constexpr std::uint64_t kPreviousVersion = 2;

// The request envelope.
inline constexpr const char* kRequest = "request";
inline constexpr const char* kVersion = "version";

// Request types, in the order the daemon compares them.
inline constexpr const char* kAdd = "add";
inline constexpr const char* kRemove = "remove";
inline constexpr const char* kBulk = "bulk";
inline constexpr const char* kMatch = "match";
inline constexpr const char* kReady = "ready";
inline constexpr const char* kAccess = "access";
inline constexpr const char* kAnnotate = "annotate";
inline constexpr const char* kLock = "lock";

// Request and reply fields.
inline constexpr const char* kPaths = "paths";
inline constexpr const char* kUuids = "uuids";
inline constexpr const char* kFlags = "flags";
inline constexpr const char* kRules = "rules";
inline constexpr const char* kAnnotations = "annotations";
inline constexpr const char* kMatches = "matches";
inline constexpr const char* kExtensions = "extensions";
inline constexpr const char* kConflicts = "conflicts";
inline constexpr const char* kErrorCode = "errorcode";
inline constexpr const char* kError = "error";

// Discovery flags.
inline constexpr std::uint64_t kDiscoverAllVersions = 0x1;
inline constexpr std::uint64_t kDiscoverAllCopies = 0x4;
inline constexpr std::uint64_t kDiscoverSystemOnly = 0x8;
inline constexpr std::uint64_t AXDiscoverAll = 0x200;

// Hold flags: the whole value selects the mode.
inline constexpr std::uint64_t kHoldApplications = 1;
inline constexpr std::uint64_t kHoldPlugIns = 2;

// The most elements one request's "paths" or "uuids" may hold: a longer list is refused with
// code 4, so that one request cannot hold every other client's work for long.
inline constexpr std::size_t kMaxListLength = 4096;

// Error codes of the "Annexa" domain.
enum Code : std::int64_t {
  kRegistryRefused = 2,
  kMalformedRequest = 4,
  kMalformedInterface = 6,
  kUnsupportedVersion = 7,
  kBadPath = 9,
  kNotEntitled = 11,
  kMisconfigured = 12,
  kBusy = 14,
};

// Typed getters over a message dictionary: the value under |key| when it has that type,
// otherwise null (a missing key and a key of another type look the same).
const value::Array* getArray(const value::Dictionary& message, const char* key);
const value::Dictionary* getDictionary(const value::Dictionary& message, const char* key);

}  // namespace AXProtocol
