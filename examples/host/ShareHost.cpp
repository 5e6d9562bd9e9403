// share-host: a host of the extension point org.annexa.share. It asks axd for the plug-ins that
// take plain text and that it may use and, for each, builds the message interface of the protocol
// that the plug-in's manifest (merged with the extension point's SDK) names, then checks a few
// messages against it: the interface lets through what the host declared and refuses the rest.

#include <cstdio>
#include <cstring>
#include <future>
#include <string>
#include <vector>

#include "Annexa/AXDaemonClient.h"
#include "Annexa/AXInterfaceBuilder.h"
#include "Annexa/AXPlugInInterface.h"
#include "Annexa/AXProtocol.h"
#include "platform/runtime/Runtime.h"

namespace {

using runtime::Argument;
using value::Value;

constexpr const char* kUsage =
    "usage: share-host [--help]\n"
    "Discovers the plug-ins that take text/plain through axd (ANNEXA_ROOT selects the device)\n"
    "and prints, for each, its protocol and which share messages its interface admits.\n";

// The protocols and the class this host speaks, one line each.
void registerProtocols() {
  AXRootProtocol();
  auto& rt = runtime::Runtime::shared();
  rt.addProtocol("org.annexa.share.Progress", {}, {"report:"});
  rt.addProtocol("org.annexa.share.Sharing", {"QSObject"}, {"share:progress:"});
  rt.addProtocol("org.annexa.share.Cancelling", {}, {"cancel"});
  rt.addClass("ShareItem", [](const Value& v) {
    return v.asDictionary() && v.asDictionary()->find("text") &&
           v.asDictionary()->find("text")->asString();
  });
}

// What the host allows: a share item or plain text, and a proxy to report progress on; the
// reply says whether the item was shared.
const AXPlugInInterface::Configuration kConfiguration = {
    {"share:progress:",
     "request:0:{ShareItem+String},request:1:org.annexa.share.Progress,reply:0:{Boolean}"},
};

std::optional<value::Array> discoverSharePlugIns(AXDaemonClient& client) {
  std::promise<zyn::ReplyOrError> promise;
  // Share plug-ins take plain text: the extension point's SDK gives them that attribute.
  value::Dictionary rule{{"Types", Value::string("text/plain")}};
  client.matchPlugIns(rule, 0, [&](const zyn::ReplyOrError& reply) { promise.set_value(reply); });
  zyn::ReplyOrError reply = promise.get_future().get();
  if (auto error = AXDaemonClient::errorInReply(reply)) {
    std::fprintf(stderr, "share-host: %s\n", error->description().c_str());
    return std::nullopt;
  }
  const value::Dictionary* body = std::get<Value>(reply).asDictionary();
  const Value* matches = body ? body->find(AXProtocol::kMatches) : nullptr;
  std::optional<Value> list = matches ? client.convertFromZyn(*matches) : std::nullopt;
  if (!list || !list->asArray()) return value::Array();
  return *list->asArray();
}

void tryMessage(const runtime::MessageInterface& interface, const char* what, bool reply,
                const std::vector<Argument>& arguments) {
  os::Status status = interface.checkArguments("share:progress:", reply, arguments);
  std::printf("  %-44s %s\n", what,
              status.ok() ? "allowed" : ("refused: " + status.error().message).c_str());
}

const char* textOf(const value::Dictionary& form, const char* key) {
  const Value* field = form.find(key);
  return field && field->asString() ? field->asString()->c_str() : "?";
}

bool showPlugIn(const value::Dictionary& form) {
  std::printf("%s at %s\n", textOf(form, "identifier"), textOf(form, "path"));
  std::optional<AXError> error;
  auto interface = AXPlugInInterface::make(form, kConfiguration, &error);
  if (!interface) {
    std::printf("  no interface: %s\n", error->description().c_str());
    return false;
  }
  std::printf("  protocol %s\n", interface->protocol()->name().c_str());
  auto progress =
      Argument::proxy(runtime::Runtime::shared().lookUpProtocol("org.annexa.share.Progress"));
  Value item = Value::dictionary({{"text", Value::string("Buy milk")}});
  tryMessage(*interface, "share:progress: (item, progress proxy)", false, {item, progress});
  tryMessage(*interface, "share:progress: (text, progress proxy)", false,
             {Value::string("Buy milk"), progress});
  tryMessage(*interface, "share:progress: (data, progress proxy)", false,
             {Value::data({0xca, 0xfe}), progress});
  tryMessage(*interface, "share:progress: (text, text)", false,
             {Value::string("Buy milk"), Value::string("50%")});
  tryMessage(*interface, "reply to share:progress: (true)", true, {Value::boolean(true)});
  return true;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc > 1) {
    bool help = std::strcmp(argv[1], "--help") == 0 || std::strcmp(argv[1], "-h") == 0;
    std::fputs(kUsage, help ? stdout : stderr);
    return help ? 0 : 2;
  }
  registerProtocols();
  AXDaemonClient client;
  std::optional<value::Array> forms = discoverSharePlugIns(client);
  if (!forms) return 1;
  if (forms->empty()) std::printf("no share plug-in is visible to this process\n");
  bool ok = true;
  for (const Value& element : *forms) {
    if (const value::Dictionary* form = element.asDictionary()) ok = showPlugIn(*form) && ok;
  }
  return ok ? 0 : 1;
}
