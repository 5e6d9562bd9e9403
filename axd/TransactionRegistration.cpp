// The registration family of request handlers (add, remove, bulk) and the list walkers that
// several families share.

#include <algorithm>

#include "Annexa/AXProtocol.h"
#include "axd/AXDNames.h"
#include "axd/AXDServer.h"
#include "axd/AXDZynClient.h"
#include "axd/Transaction.h"
#include "platform/os/Format.h"
#include "platform/os/Log.h"
#include "platform/os/Paths.h"
#include "platform/os/Probes.h"

bool Transaction::marshalPaths(const PathVisitor& visitor) {
  return walkArray(AXProtocol::kPaths, "invalid request format",
                   [&](const value::Value& element) { return visitPath(element, visitor); });
}

bool Transaction::visitPath(const value::Value& element, const PathVisitor& visitor) {
  const std::string* path = element.asString();
  if (!path) {
    fail(AXProtocol::kMalformedRequest, "invalid request format");
    return false;
  }
  if (path->find('\0') != std::string::npos) {
    // The file system would read the path only up to the NUL: another path than the one sent.
    std::string shown = *path;
    std::replace(shown.begin(), shown.end(), '\0', '?');
    fail(AXProtocol::kBadPath, os::format("invalid path (NUL byte): %@", {shown}));
    return false;
  }
  if (path->empty() || (*path)[0] != '/') {
    fail(AXProtocol::kBadPath, os::format("absolute path required: %s", {*path}));
    return false;
  }
  os::Result<std::string> resolved = os::Paths::canonical(*path);
  if (resolved.ok()) return visitor(resolved.value(), true);
  return visitor(*path, false);
}

bool Transaction::processPaths(const PathVisitor& visitor) {
  if (!marshalPaths(visitor)) return false;
  done();
  return true;
}

bool Transaction::processUuidList(const PlugInVisitor& visitor) {
  return walkArray(AXProtocol::kUuids, "invalid request format (uuid)",
                   [&](const value::Value& element) { return visitUuid(element, visitor); });
}

bool Transaction::walkArray(const char* key, const char* invalid,
                            const std::function<bool(const value::Value&)>& visit) {
  const value::Array* elements = AXProtocol::getArray(request_, key);
  if (!elements) {
    fail(AXProtocol::kMalformedRequest, invalid);
    return false;
  }
  if (elements->size() > AXProtocol::kMaxListLength) {
    fail(AXProtocol::kMalformedRequest,
         os::format("invalid request format (%u elements in \"%s\", at most %u)",
                    {elements->size(), key, AXProtocol::kMaxListLength}));
    return false;
  }
  for (const value::Value& element : *elements) {
    if (!visit(element)) return false;
  }
  return true;
}

bool Transaction::visitUuid(const value::Value& element, const PlugInVisitor& visitor) {
  const value::Uuid* uuid = element.asUuid();
  if (!uuid) {
    fail(AXProtocol::kMalformedRequest, "invalid request (bad uuid array)");
    return false;
  }
  std::shared_ptr<AXDPlugIn> plugIn = server()->findPlugIn(*uuid);
  if (!plugIn) {
    fail(AXProtocol::kMalformedRequest, "no such plugin (uuid not found)");
    return false;
  }
  return visitor(plugIn);
}

void Transaction::addPlugIns() {
  processPaths([this](const std::string& path, bool resolved) {
    if (!resolved) {
      fail(AXProtocol::kBadPath, os::format("invalid plugin path: %@", {path}));
      return false;
    }
    os::Probes::pluginAdd(path.c_str());
    if (server()->addPlugIn(path)) {
      server()->log("failed to register plug-in at %@", {path});
      fail(AXProtocol::kRegistryRefused, os::format("unable to register plug-in at %@", {path}));
      return false;
    }
    return true;
  });
}

void Transaction::removePlugIns() {
  processPaths([this](const std::string& path, bool resolved) {
    os::Probes::pluginRemove(path.c_str(), resolved);
    if (!client()->hasEntitlement(AXDNames::kManagerEntitlement)) {
      server()->log(
          "refused request from pid=%d to remove plug-in at %@ - client lacks required "
          "entitlement",
          {client()->pid(), path});
      fail(AXProtocol::kNotEntitled, "caller lacks entitlement for this operation");
      return false;
    }
    if (server()->removePlugIn(path)) {
      fail(AXProtocol::kBadPath, os::format("no plugin at %@", {path}));
      return false;
    }
    return true;
  });
}

void Transaction::bulkPlugIns() {
  std::uint64_t flags = integerField(AXProtocol::kFlags);
  os::Log::notice("bulk options 0x%lx not supported", {flags});
  done();
}
