#include "axd/AXDServer.h"

#include <unistd.h>

#include <asio/post.hpp>
#include <chrono>

#include "axd/AXDNames.h"
#include "axd/AXDZynClient.h"
#include "platform/launcher/ServiceLauncher.h"
#include "platform/os/Log.h"
#include "platform/sandbox/BootKey.h"

namespace {

// The user-initiated class: above ordinary work where the system lets us.
constexpr int kServiceNiceness = -5;

// Client set-ups that may run at once: enough that one client with a large executable to hash
// does not hold up the next, few enough to bound what set-ups cost.
constexpr std::size_t kSetUpThreads = 2;

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
  server->setUpPool_ = std::make_unique<asio::thread_pool>(kSetUpThreads);
  auto listener = zyn::Listener::create(serviceName, server->zynQueue_);
  if (!listener.ok()) {
    os::Log::write(
        3, "cannot listen on " + std::string(serviceName) + ": " + listener.error().message);
    return nullptr;
  }
  server->service_ = listener.value();
  server->setDelegate(server);
  sharedServer() = server;
  std::weak_ptr<AXDServer> weak = server;
  server->service_->setEventHandler([weak](std::shared_ptr<zyn::Connection> connection) {
    if (auto self = weak.lock()) AXDZynClient::initWithConnection(std::move(connection), self);
  });
  return server;
}

void AXDServer::run() {
  warmUp();
  os::Status listening = service_->resume();
  if (!listening.ok()) {
    os::Log::write(3, listening.error().message);
    return;
  }
  for (;;) pause();
}

void AXDServer::warmUp() {
  auto start = std::chrono::steady_clock::now();
  std::shared_ptr<const PlugIns> plugIns = findPlugIns(std::nullopt);
  if (!plugIns || plugIns->size() > cacheLimit()) return;
  os::Result<std::string> key = sandbox::BootKey::load();
  AXDPlugIn::SealingKey sealing = key.ok() ? sealingKey(std::move(key).value()) : nullptr;
  for (const auto& plugIn : *plugIns) plugIn->discoveryForm(sealing);
  auto elapsed = std::chrono::duration_cast<std::chrono::milliseconds>(
      std::chrono::steady_clock::now() - start);
  os::Log::notice("built %d plug-in records in %d ms",
                  {plugIns->size(), static_cast<std::int64_t>(elapsed.count())});
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

void AXDServer::submitSetUp(std::function<void()> work) {
  asio::post(*setUpPool_, std::move(work));
}

bool AXDServer::holdOnPlugIn(const AXDPlugIn& plugIn) {
  return syncQueue_->sync([&] {
    for (const auto& hold : holds_) {
      if (hold->blocks(plugIn)) return true;
    }
    return false;
  });
}

AXDPlugIn::SealingKey AXDServer::sealingKey(std::string key) {
  if (!sealingKey_ || *sealingKey_ != key) {
    sealingKey_ = std::make_shared<const std::string>(std::move(key));
  }
  return sealingKey_;
}

bool AXDServer::addHold(std::shared_ptr<AXDPlugInHold> hold) {
  // The client's death stops its work before its holds are released under this same queue, so
  // a hold added here is either released by that release or refused now.
  bool added = syncQueue_->sync([&] {
    std::shared_ptr<AXDZynClient> client = hold->client();
    if (client && !client->acceptWork()) return false;
    holds_.push_back(std::move(hold));
    return true;
  });
  if (added) postAnnotationChange();
  return added;
}

void AXDServer::unholdToken(const value::Uuid& token) {
  std::shared_ptr<AXDPlugInHold> released = syncQueue_->sync(
      [&] { return takeHold([&](const AXDPlugInHold& hold) { return hold.uuid() == token; }); });
  if (!released) return;
  log("releasing plug-in hold %@ at client's request", {token.string()});
  postAnnotationChange();
}

void AXDServer::unholdClient(const AXDZynClient& client) {
  for (;;) {
    std::shared_ptr<AXDPlugInHold> released = syncQueue_->sync(
        [&] { return takeHold([&](const AXDPlugInHold& hold) { return hold.isHeldBy(client); }); });
    if (!released) return;
    log("releasing plug-in hold %@ for dead client pid %d",
        {released->uuid().string(), client.pid()});
    postAnnotationChange();
  }
}

std::vector<std::shared_ptr<AXDPlugInHold>> AXDServer::holds() {
  return syncQueue_->sync([&] { return holds_; });
}

std::shared_ptr<AXDPlugInHold> AXDServer::takeHold(
    const std::function<bool(const AXDPlugInHold&)>& matches) {
  for (auto it = holds_.begin(); it != holds_.end(); ++it) {
    if (!matches(**it)) continue;
    std::shared_ptr<AXDPlugInHold> hold = *it;
    holds_.erase(it);
    return hold;
  }
  return nullptr;
}

void AXDServer::removedPlugIns(const registrum::PlugInList& plugIns) {
  std::weak_ptr<AXDServer> weak = std::static_pointer_cast<AXDServer>(shared_from_this());
  for (const auto& record : plugIns) {
    // Services are named as enabling names them; without both names there is none to withdraw.
    const auto& id = record->plugInIdentifier();
    const auto& version = record->plugInVersion();
    if (!id || id->empty() || !version || version->empty()) continue;
    auto completion = [weak, identifier = *id](int result) {
      if (result == 0 || result == launcher::ServiceLauncher::kNoSuchService) return;
      if (auto self = weak.lock()) self->log("PLUGIN REMOVAL:%@ RESULT:%d", {identifier, result});
    };
    launcher::ServiceLauncher::removeService(*id, *version, mainQueue_, completion);
  }
}
