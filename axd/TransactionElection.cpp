// The election request: annotate.

#include "Annexa/AXProtocol.h"
#include "axd/AXDServer.h"
#include "axd/AXDZynClient.h"
#include "axd/Transaction.h"

namespace {

constexpr const char* kElection = "election";
constexpr const char* kExtension = "extension";

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
    if (!election->isNumber()) {
      fail(AXProtocol::kMalformedRequest, "invalid request format (annotation election)");
      return;
    }
    annotation = annotation.with(kElection, *election);
  }
  if (const value::Value* extension = annotations->find(kExtension)) {
    if (!extension->asDictionary()) {
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
    server()->setAnnotation(annotation, *plugIn);
    return true;
  });
  if (stored) done();
}
