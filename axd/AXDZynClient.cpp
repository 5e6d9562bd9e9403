#include "axd/AXDZynClient.h"

#include "axd/AXDServer.h"
#include "axd/Transaction.h"
#include "platform/os/Probes.h"

namespace {

// Executable paths that do not fit the platform's path buffer count as not found.
constexpr std::size_t kExecutablePathBuffer = 2048;

}  // namespace

void AXDZynClient::initWithConnection(std::shared_ptr<zyn::Connection> connection,
                                      std::shared_ptr<AXDServer> server) {
  server->submitSetUp([connection, server] { setUpConnection(connection, server); });
}

std::shared_ptr<AXDZynClient> AXDZynClient::setUpConnection(
    std::shared_ptr<zyn::Connection> connection, std::shared_ptr<AXDServer> server) {
  std::shared_ptr<AXDZynClient> client(new AXDZynClient(connection, std::move(server)));
  if (!client->setUp(connection)) return nullptr;
  return client;
}

AXDZynClient::AXDZynClient(std::shared_ptr<zyn::Connection> connection,
                           std::shared_ptr<AXDServer> server)
    : connection_(connection), server_(std::move(server)) {}

bool AXDZynClient::setUp(const std::shared_ptr<zyn::Connection>& connection) {
  std::string path = connection->peerExecutablePath().value_or(std::string());
  if (path.size() >= kExecutablePathBuffer) path.clear();
  if (!path.empty()) bundle_ = AXBundle::initWithExecutableURL(AXFileURL(path));
  server_->debug("client %d %s", {pid(), path});
  _task = codesign::Task::fromAuditToken(connection->peerPid(), connection->auditToken());
  if (!runsProgramOfTask(*connection)) {
    // An exec between the accept and the reading of the entitlements: they would belong to
    // another program than the one the connection checks each request against.
    server_->log("refusing client %d: its program changed while it was set up", {pid()});
    connection->cancel();
    return false;
  }
  os::Probes::clientNew(pid());
  auto self = shared_from_this();
  connection->setContext(self);
  connection->setEventHandler([self](const zyn::Event& event) { self->handleEvent(event); });
  // Only now is anything of the client read, so its first request is handled with its
  // entitlements known.
  connection->resume();
  return true;
}

bool AXDZynClient::runsProgramOfTask(const zyn::Connection& connection) const {
  if (!_task) return true;
  const auto& accepted = connection.peer().program;
  return accepted && _task->program() && *accepted == *_task->program();
}

void AXDZynClient::handleEvent(const zyn::Event& event) {
  if (const auto* error = std::get_if<zyn::ServiceError>(&event)) {
    switch (error->kind) {
      case zyn::ErrorKind::TerminationImminent:
        dying();
        return;
      case zyn::ErrorKind::ConnectionInvalid:
        dead();
        return;
      case zyn::ErrorKind::MessageTooLarge:
        break;
    }
    server_->log("unexpected error %@", {error->description});
    return;
  }
  handleMessage(std::get<zyn::Message>(event));
}

void AXDZynClient::handleMessage(const zyn::Message& message) {
  if (!message.body.asDictionary()) {
    auto connection = connection_.lock();
    server_->log("unexpected message %@ on connection %@",
                 {message.body.description(), connection ? connection->description() : ""});
    return;
  }
  if (server_->verbose() >= 2) server_->debug("incoming request %@", {message.body.description()});
  if (os::Probes::requestInputEnabled()) {
    std::string text = message.body.description();
    os::Probes::requestInput(pid(), text.c_str());
  }
  auto transaction = std::make_shared<Transaction>(message, shared_from_this());
  auto self = shared_from_this();
  server_->submitWork([self, transaction] {
    std::uint32_t count = ++self->requestCount_;
    if (count % 1000 == 0) {
      self->server_->debug("client %d used %u requests so far", {self->pid(), count});
    }
    transaction->dispatch();
  });
}

pid_t AXDZynClient::pid() const {
  auto connection = connection_.lock();
  return connection ? connection->peerPid() : 0;
}

std::optional<value::Value> AXDZynClient::entitlementValueForKey(std::string_view key) const {
  if (!_task) return std::nullopt;
  std::optional<os::Error> error;
  std::optional<value::Value> entitlement = _task->entitlementValue(key, &error);
  if (error) server_->log("error retrieving entitlements for pid %d", {pid()});
  return entitlement;
}

bool AXDZynClient::hasEntitlement(std::string_view key) const {
  std::optional<value::Value> entitlement = entitlementValueForKey(key);
  if (!entitlement) return false;
  if (auto b = entitlement->asBool()) return *b;
  if (auto real = entitlement->asReal()) return *real != 0;
  if (entitlement->isNumber()) return entitlement->integerValue() != 0;
  return true;
}

void AXDZynClient::dying() {
  server_->debug("client %d termination imminent", {pid()});
}

void AXDZynClient::dead() {
  server_->debug("client %d is dead", {pid()});
  acceptWork_.store(false);
  server_->unholdClient(*this);
  os::Probes::clientDone(pid());
}

std::string AXDZynClient::description() const {
  auto connection = connection_.lock();
  if (!connection)
    return os::format("<AXDZynClient %p NO CONNECTION>", {static_cast<const void*>(this)});
  return os::format("<AXDZynClient %p pid=%d con=%@>",
                    {static_cast<const void*>(this), pid(), connection->description()});
}
