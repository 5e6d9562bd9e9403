// The election request: annotate.

#include "Annexa/AXProtocol.h"
#include "axd/AXDServer.h"
#include "axd/AXDZynClient.h"
#include "axd/Transaction.h"
#include "platform/os/Format.h"
#include "platform/value/PropertyList.h"

namespace {

constexpr const char* kElection = "election";
constexpr const char* kExtension = "extension";

// True when the annotation file can hold |value|. The wire carries values a property list cannot
// (UUIDs, envelopes, integers above 2^63 - 1, text with NUL); storing one would leave every
// later change of the file unsaved.
bool storable(const value::Value& value) {
  return value::PropertyList::toXml(value).ok();
}

}  // namespace

void Transaction::annotatePlugIns() {
  const value::Dictionary* annotations =
      AXProtocol::getDictionary(request_, AXProtocol::kAnnotations);
  if (!annotations) {
    fail(AXProtocol::kMalformedRequest, "invalid request format (bad annotations dictionary)");
    return;
  }
  value::Dictionary annotation;
  if (const value::Value* election = annotations->find(kElection)) {
    if (!election->isNumber() || !storable(*election)) {
      fail(AXProtocol::kMalformedRequest, "invalid request format (annotation election)");
      return;
    }
    annotation = annotation.with(kElection, *election);
  }
  if (const value::Value* extension = annotations->find(kExtension)) {
    if (!extension->asDictionary() || !storable(*extension)) {
      fail(AXProtocol::kMalformedRequest, "invalid request format (annotation extension)");
      return;
    }
    annotation = annotation.with(kExtension, *extension);
  }
  if (annotation.empty()) {
    done();
    return;
  }
  bool stored = processUuidList([&](const std::shared_ptr<AXDPlugIn>& plugIn) {
    const value::Value* election = annotation.find(kElection);
    server()->log("client %d plug-in %@ election := %@",
                  {client()->pid(), plugIn->identifier().value_or("(null)"),
                   election ? election->description() : std::string("(null)")});
    // The client hears of a change that was not saved: it is not kept either.
    if (std::optional<AXError> unsaved = server()->setAnnotation(annotation, *plugIn)) {
      fail(AXProtocol::kMalformedRequest,
           os::format("unable to save annotations: %@",
                      {unsaved->localizedDescription().value_or("unknown error")}));
      return false;
    }
    return true;
  });
  if (stored) done();
}
