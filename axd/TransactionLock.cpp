// The lock request: placing a hold on plug-ins, or releasing holds by their tokens.

#include "Annexa/AXProtocol.h"
#include "axd/AXDPlugInHold.h"
#include "axd/AXDServer.h"
#include "axd/AXDZynClient.h"
#include "axd/Transaction.h"

namespace {

std::string describe(const std::vector<std::shared_ptr<AXDPlugIn>>& plugIns) {
  std::string text = "(";
  for (const auto& plugIn : plugIns) {
    if (text.size() > 1) text += ", ";
    text += plugIn->identifier().value_or("(null)") + " " + plugIn->path();
  }
  return text + ")";
}

}  // namespace

void Transaction::lockDownPlugIns() {
  if (const value::Value* tokens = request_.find(AXProtocol::kUuids); tokens && tokens->asArray()) {
    // Release is by token alone; an element that is no token releases nothing.
    for (const value::Value& token : *tokens->asArray()) {
      if (const value::Uuid* uuid = token.asUuid()) server()->unholdToken(*uuid);
    }
    done();
    return;
  }
  std::uint64_t flags = integerField(AXProtocol::kFlags);
  std::vector<std::string> paths;
  std::optional<std::vector<std::shared_ptr<AXDPlugIn>>> held = plugInsToHold(flags, paths);
  if (!held) return;
  std::vector<std::shared_ptr<AXDPlugIn>> busy;
  value::Array conflicts;
  // Holding one bundle is how an installer replaces it: its running instances are not asked.
  if (flags != AXProtocol::kHoldPlugIns) {
    for (const auto& plugIn : *held) {
      if (std::optional<value::Dictionary> answer = plugIn->checkBusy()) {
        busy.push_back(plugIn);
        conflicts.push_back(value::Value::dictionary(*answer));
      }
    }
  }
  if (!busy.empty()) {
    server()->debug("hold rejected. Busy plug-ins:%@", {describe(busy)});
    reply_.set(AXProtocol::kConflicts, value::Value::array(std::move(conflicts)));
    fail(AXProtocol::kBusy, "plug-ins are busy");
    return;
  }
  auto hold = std::make_shared<AXDPlugInHold>(*held, std::move(paths), client_);
  if (!server()->addHold(hold)) {
    server()->debug("hold for dead client %d dropped", {client_->pid()});
    return;
  }
  reply_.set(AXProtocol::kUuids, value::Value::uuid(hold->uuid()));
  server()->debug("hold request granted uuid:%@", {hold->uuid().string()});
  done();
}

std::optional<std::vector<std::shared_ptr<AXDPlugIn>>> Transaction::plugInsToHold(
    std::uint64_t flags, std::vector<std::string>& paths) {
  std::vector<std::shared_ptr<AXDPlugIn>> held;
  bool walked = marshalPaths([&](const std::string& path, bool resolved) {
    if (!resolved) {
      fail(AXProtocol::kBadPath, os::format("invalid path: %@", {path}));
      return false;
    }
    if (flags == AXProtocol::kHoldPlugIns) {
      std::shared_ptr<AXDPlugIn> plugIn = server()->findPlugInAtPath(path);
      if (!plugIn) fail(AXProtocol::kBadPath, os::format("no plug-in at path:%@", {path}));
      if (!plugIn) return false;
      held.push_back(plugIn);
      paths.push_back(plugIn->path());
      return true;
    }
    if (flags == AXProtocol::kHoldApplications) {
      auto within = server()->plugInsWithinApplication(path);
      if (within) held.insert(held.end(), within->begin(), within->end());
      paths.push_back(path);
      return true;
    }
    fail(AXProtocol::kMalformedRequest, "invalid request format (unsupported hold flags)");
    return false;
  });
  if (!walked) return std::nullopt;
  return held;
}
