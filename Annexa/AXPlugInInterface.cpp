#include "Annexa/AXPlugInInterface.h"

#include "Annexa/AXFileURL.h"
#include "Annexa/AXInterfaceBuilder.h"
#include "Annexa/AXPlugInCore.h"
#include "Annexa/AXProtocol.h"

namespace {

std::shared_ptr<runtime::MessageInterface> fail(std::optional<AXError>* error, AXError failure) {
  if (error) *error = std::move(failure);
  return nullptr;
}

// The record of the form's "identifier" at its "path" whose plug-in dictionary is the form's
// "info": the manifest as the daemon resolved it against its extension point's SDK, which the
// form's "bundleInfo" is not. Null when any of the three is missing or of another type.
std::shared_ptr<AXPlugInCore> recordOf(const value::Dictionary& form) {
  const value::Value* identifier = form.find("identifier");
  const value::Value* path = form.find("path");
  const value::Value* info = form.find("info");
  if (!identifier || !identifier->asString() || !path || !path->asString() || !info ||
      !info->asDictionary()) {
    return nullptr;
  }
  return AXPlugInCore::initWithName(*identifier->asString(), AXFileURL(*path->asString()),
                                    std::nullopt, *info->asDictionary(), std::nullopt);
}

std::shared_ptr<const runtime::Protocol> protocolOf(const AXPlugInCore& record,
                                                    std::optional<AXError>* error) {
  std::string name = record.identifier().value_or("");
  if (record.isData()) {
    fail(error, AXMakeErrorWithFormat(AXProtocol::kMisconfigured,
                                      "%@ is a data plug-in: it has no protocol", {name}));
    return nullptr;
  }
  std::optional<value::Value> specification = record.protocolSpec();
  std::optional<AXError> failure;
  auto protocol = specification ? AXProtocolFromSpec(*specification, &failure) : nullptr;
  if (protocol) return protocol;
  if (!failure) {
    failure = AXMakeErrorWithFormat(
        AXProtocol::kMisconfigured, "%@ names no protocol: \"QSExtensionProtocol\" is %@",
        {name, specification ? specification->description() : "absent"});
  }
  fail(error, std::move(*failure));
  return nullptr;
}

}  // namespace

std::shared_ptr<runtime::MessageInterface> AXPlugInInterface::make(
    const value::Dictionary& form, const Configuration& configuration,
    std::optional<AXError>* error) {
  auto record = recordOf(form);
  if (!record)
    return fail(error, AXMakeError(AXProtocol::kMalformedRequest,
                                   "not a plug-in form: it needs a string \"identifier\", a "
                                   "string \"path\" and a dictionary \"info\""));
  auto protocol = protocolOf(*record, error);
  if (!protocol) return nullptr;
  auto interface = std::make_shared<runtime::MessageInterface>(std::move(protocol));
  for (const auto& [selector, specification] : configuration) {
    if (auto failure = AXConfigureInterface(*interface, selector, specification)) {
      return fail(error, std::move(*failure));
    }
  }
  return interface;
}
