#include "axd/Transaction.h"

#include <string_view>

#include "Annexa/AXProtocol.h"
#include "axd/AXDServer.h"
#include "axd/AXDZynClient.h"
#include "platform/os/Probes.h"

namespace {

// The request types and their handlers, in the order the type is compared.
struct Handler {
  std::string_view type;
  void (Transaction::*serve)();
  // False for a request that reads no plug-in record: it need not take the SDK changes first
  // (a system call); the next request that reads records takes them.
  bool readsRecords;
};

constexpr Handler kHandlers[] = {
    {AXProtocol::kAdd, &Transaction::addPlugIns, true},
    {AXProtocol::kRemove, &Transaction::removePlugIns, true},
    {AXProtocol::kBulk, &Transaction::bulkPlugIns, false},
    {AXProtocol::kMatch, &Transaction::matchPlugIns, true},
    {AXProtocol::kReady, &Transaction::readyPlugIns, true},
    {AXProtocol::kAccess, &Transaction::accessPlugIns, true},
    {AXProtocol::kAnnotate, &Transaction::annotatePlugIns, true},
    {AXProtocol::kLock, &Transaction::lockDownPlugIns, true},
};

// The handler of |type|; null for a missing or unknown type.
const Handler* handlerFor(const std::string* type) {
  if (!type) return nullptr;
  for (const Handler& handler : kHandlers) {
    if (*type == handler.type) return &handler;
  }
  return nullptr;
}

}  // namespace

Transaction::Transaction(const zyn::Message& request, std::shared_ptr<AXDZynClient> client)
    : client_(std::move(client)),
      request_(request.body.asDictionary() ? *request.body.asDictionary() : value::Dictionary()),
      reply_(request) {}

const std::shared_ptr<AXDServer>& Transaction::server() const {
  return client_->server();
}

std::shared_ptr<zyn::Connection> Transaction::connection() const {
  return client_->connection();
}

void Transaction::dispatch() {
  const value::Value* typeValue = request_.find(AXProtocol::kRequest);
  const std::string* type = typeValue ? typeValue->asString() : nullptr;
  version_ = integerField(AXProtocol::kVersion);
  if (version_ != AXProtocol::kCurrentVersion && version_ != AXProtocol::kPreviousVersion) {
    fail(AXProtocol::kUnsupportedVersion, os::format("unsupported protocol version %d (current %d)",
                                                     {version_, AXProtocol::kCurrentVersion}));
    return;
  }
  if (!client_->acceptWork()) return;
  const Handler* handler = handlerFor(type);
  if (handler && handler->readsRecords) server()->noteSdkChanges();
  pid_t pid = client_->pid();
  const char* typeText = type ? type->c_str() : nullptr;
  server()->debug("client %d request %s", {pid, typeText});
  os::Probes::request(pid, typeText);
  if (!type) {
    fail(AXProtocol::kMalformedRequest, "invalid request format (missing type)");
    return;
  }
  if (!handler) {
    fail(AXProtocol::kMalformedRequest, "unrecognized request");
    return;
  }
  (this->*handler->serve)();
}

void Transaction::done() {
  if (server()->verbose() >= 2) server()->debug("Replying %@", {reply_.body().description()});
  if (os::Probes::requestOutputEnabled()) {
    std::string text = reply_.body().description();
    os::Probes::requestOutput(client_->pid(), text.c_str());
  }
  auto connection = this->connection();
  if (!connection) return;
  os::Status sent = connection->send(reply_);
  if (sent.ok()) return;
  server()->log("not sending the reply to client %d: %@", {client_->pid(), sent.error().message});
  // Sent as it is: however small the limit, it leaves room for this.
  reply_.clear();
  reply_.set(
      AXProtocol::kErrorCode,
      value::Value::unsignedInteger(static_cast<std::uint64_t>(AXProtocol::kMalformedRequest)));
  reply_.set(AXProtocol::kError, value::Value::string(sent.error().message));
  static_cast<void>(connection->send(reply_));
}

void Transaction::fail(std::int64_t code, const std::optional<std::string>& message) {
  reply_.set(AXProtocol::kErrorCode,
             value::Value::unsignedInteger(static_cast<std::uint64_t>(code)));
  if (message) reply_.set(AXProtocol::kError, value::Value::string(*message));
  done();
}

void Transaction::fail(std::int64_t code, const AXError& error) {
  if (error.domain() == AXErrorDomain) {
    fail(error.code(), error.localizedDescription());
  } else {
    fail(code, error.localizedDescription());
  }
}

std::uint64_t Transaction::integerField(const char* key) const {
  const value::Value* field = request_.find(key);
  return field && field->asUInt() ? *field->asUInt() : 0;
}
