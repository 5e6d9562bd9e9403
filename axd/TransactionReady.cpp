// The ready and access requests: making plug-ins launchable for the client's process, and read
// access to their bundles.

#include "Annexa/AXProtocol.h"
#include "Annexa/AXSandboxExtension.h"
#include "axd/AXDServer.h"
#include "axd/AXDZynClient.h"
#include "axd/Transaction.h"
#include "platform/os/Probes.h"

namespace {

std::string uuidText(const AXDPlugIn& plugIn) {
  return plugIn.uuid() ? plugIn.uuid()->string() : "(null)";
}

}  // namespace

void Transaction::readyPlugIns() {
  std::vector<std::shared_ptr<AXDPlugIn>> ready;
  bool checked = processUuidList([&](const std::shared_ptr<AXDPlugIn>& plugIn) {
    os::Probes::pluginReady(uuidText(*plugIn).c_str());
    std::optional<std::string> refusal = readyRefusal(*plugIn);
    if (refusal) {
      fail(AXProtocol::kNotEntitled,
           os::format("access to plugin %@ denied: %@",
                      {plugIn->identifier().value_or("(null)"), *refusal}));
      return false;
    }
    bool listed = std::any_of(ready.begin(), ready.end(),
                              [&](const auto& other) { return other->isEqual(*plugIn); });
    if (!plugIn->isData() && !listed) ready.push_back(plugIn);
    return true;
  });
  if (!checked) return;
  std::optional<AXError> firstFailure;
  for (const auto& plugIn : ready) {
    std::optional<AXError> failed = plugIn->enableForPid(client_->pid());
    if (failed && !firstFailure) firstFailure = failed;
  }
  if (firstFailure) {
    fail(firstFailure->code(), *firstFailure);
    return;
  }
  done();
}

std::optional<std::string> Transaction::readyRefusal(const AXDPlugIn& plugIn) {
  std::string id = plugIn.identifier().value_or("(null)");
  if (server()->holdOnPlugIn(plugIn)) {
    server()->debug("denied access to pid %d for plugin %@(%@): the plug-in is on hold",
                    {client_->pid(), id, uuidText(plugIn)});
    return std::string("the plug-in is on hold");
  }
  // A data plug-in is never launched, so no host policy applies to it.
  if (plugIn.isData()) return std::nullopt;
  std::optional<std::string> refusal = plugIn.allowForClient(*client_);
  if (refusal) {
    server()->debug("denied access to pid %d for plugin %@(%@): %@",
                    {client_->pid(), id, uuidText(plugIn), *refusal});
  }
  return refusal;
}

void Transaction::accessPlugIns() {
  value::Array tokens;
  bool issued = processUuidList([&](const std::shared_ptr<AXDPlugIn>& plugIn) {
    std::optional<AXFileURL> location = plugIn->url();
    os::Result<std::string> token = location ? AXSandboxIssueReadExtension(*location)
                                             : os::Result<std::string>(os::Error{ENOENT, ""});
    if (!token.ok()) {
      fail(AXProtocol::kMalformedRequest,
           os::format("cannot create extension to %@: %d", {plugIn->path(), token.error().errnum}));
      return false;
    }
    tokens.push_back(value::Value::string(token.value()));
    return true;
  });
  if (!issued) return;
  reply_.set(AXProtocol::kExtensions, value::Value::array(std::move(tokens)));
  done();
}
