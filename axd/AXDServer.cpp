#include "axd/AXDServer.h"

#include <unistd.h>

#include "axd/AXDZynClient.h"
#include "platform/os/Log.h"

namespace {

// The user-initiated class: above ordinary work where the system lets us.
constexpr int kServiceNiceness = -5;

// Never destroyed, like the server it points to.
std::shared_ptr<AXDServer>& sharedServer() {
  static auto* server = new std::shared_ptr<AXDServer>();
  return *server;
}

}  // namespace

std::shared_ptr<AXDServer> AXDServer::initForService(const char* serviceName,
                                                     const char* databasePath) {
  std::shared_ptr<AXDServer> server(new AXDServer());
  if (!server->initWithDatabase(databasePath)) return nullptr;
  server->zynQueue_ = std::make_shared<zyn::StrandQueue>("zyn");
  server->mainQueue_ = std::make_shared<zyn::ThreadQueue>("service", kServiceNiceness);
  server->syncQueue_ = std::make_unique<zyn::SyncQueue>("serverSync");
  auto listener = zyn::Listener::create(serviceName, server->zynQueue_);
  if (!listener.ok()) {
    os::Log::write(
        3, "cannot listen on " + std::string(serviceName) + ": " + listener.error().message);
    return nullptr;
  }
  server->service_ = listener.value();
  sharedServer() = server;
  std::weak_ptr<AXDServer> weak = server;
  server->service_->setEventHandler([weak](std::shared_ptr<zyn::Connection> connection) {
    if (auto self = weak.lock()) AXDZynClient::initWithConnection(std::move(connection), self);
  });
  return server;
}

void AXDServer::run() {
  service_->resume();
  for (;;) pause();
}

std::shared_ptr<AXDServer> AXDServer::server() {
  return sharedServer();
}

void AXDServer::log(int level, std::string_view format,
                    std::initializer_list<os::FormatArg> arguments) const {
  os::Log::write(level, os::format(format, arguments));
}

void AXDServer::log(std::string_view format, std::initializer_list<os::FormatArg> arguments) const {
  log(5, format, arguments);
}

void AXDServer::debug(std::string_view format,
                      std::initializer_list<os::FormatArg> arguments) const {
  if (verbose() == 0) return;
  log(6, format, arguments);
}

void AXDServer::submitWork(std::function<void()> work) {
  mainQueue_->async(std::move(work));
}
