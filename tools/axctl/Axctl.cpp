#include "tools/axctl/Axctl.h"

#include <sys/wait.h>

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <future>
#include <iostream>

#include "Annexa/AXPlugInLauncher.h"
#include "Annexa/AXProtocol.h"
#include "tools/axctl/ValueJson.h"

using value::Value;

namespace {

const char* textOf(const value::Dictionary& d, const char* key) {
  const Value* v = d.find(key);
  return v && v->asString() ? v->asString()->c_str() : "-";
}

std::string electionOf(const value::Dictionary& form) {
  const value::Dictionary* annotations = AXProtocol::getDictionary(form, "annotations");
  const Value* election = annotations ? annotations->find("election") : nullptr;
  auto number = election ? election->integerValue() : std::nullopt;
  return number ? std::to_string(*number) : "-";
}

// A token as it is, so that a script can pass it on; any other value as JSON.
std::string lineOf(const Value& v) {
  if (const std::string* text = v.asString()) return *text;
  if (v.asUuid()) return v.asUuid()->string();
  return toJson(v).dump();
}

// Discovery by UUID must find the plug-in whatever other versions and copies exist.
constexpr std::uint64_t kEveryRecord =
    AXProtocol::kDiscoverAllVersions | AXProtocol::kDiscoverAllCopies;

bool hasUuid(const value::Dictionary& form, const value::Uuid& uuid) {
  const Value* text = form.find("uuid");
  return text && text->asString() && value::Uuid::parse(*text->asString()) == uuid;
}

void printPid(pid_t pid, bool json) {
  if (json) {
    std::printf("%s\n", nlohmann::ordered_json{{"pid", pid}}.dump().c_str());
  } else {
    std::printf("%d\n", static_cast<int>(pid));
  }
  // The child shares standard output: the pid comes first.
  std::fflush(stdout);
}

// The exit status that stands for |child|'s end, as a shell reports it.
int waitFor(pid_t child) {
  int status = 0;
  while (waitpid(child, &status, 0) < 0) {
    if (errno == EINTR) continue;
    std::fprintf(stderr, "axctl: waiting for pid %d: %s\n", static_cast<int>(child),
                 std::strerror(errno));
    return 1;
  }
  return WIFSIGNALED(status) ? 128 + WTERMSIG(status) : WEXITSTATUS(status);
}

}  // namespace

Axctl::Axctl(const Options& options)
    : options_(options), client_(options.serviceName ? options.serviceName->c_str() : nullptr) {
  if (options.protocolVersion) client_.setProtocolVersion(*options.protocolVersion);
}

int Axctl::call(const Send& send, const Print& print) {
  std::optional<value::Dictionary> fields = request(send, options_.json);
  if (!fields) return 1;
  if (options_.json) {
    std::cout << toJson(Value::dictionary(*fields)).dump(2) << "\n";
  } else {
    print(*fields);
  }
  return 0;
}

std::optional<value::Dictionary> Axctl::request(const Send& send, bool json) {
  std::promise<zyn::ReplyOrError> promise;
  auto future = promise.get_future();
  send(client_, [&promise](const zyn::ReplyOrError& reply) { promise.set_value(reply); });
  zyn::ReplyOrError reply = future.get();
  std::optional<AXError> error;
  try {
    error = AXDaemonClient::errorInReply(reply);
  } catch (const AXInternalInconsistency& breach) {
    std::fprintf(stderr, "axctl: %s\n", breach.what());
    return std::nullopt;
  }
  const Value* body = std::get_if<Value>(&reply);
  if (!error) return body->asDictionary() ? *body->asDictionary() : value::Dictionary();
  if (json) {
    Value failure =
        body ? *body
             : Value::dictionary({{AXProtocol::kErrorCode, Value::integer(error->code())},
                                  {AXProtocol::kError,
                                   Value::string(error->localizedDescription().value_or(""))}});
    std::cout << toJson(failure).dump(2) << "\n";
  }
  std::fprintf(stderr, "axctl: error %lld: %s\n", static_cast<long long>(error->code()),
               error->localizedDescription().value_or("").c_str());
  return std::nullopt;
}

std::optional<Value> Axctl::matchesIn(const value::Dictionary& reply) const {
  const Value* matches = reply.find(AXProtocol::kMatches);
  std::optional<Value> list = matches ? client_.convertFromZyn(*matches) : std::nullopt;
  if (!list || !list->asArray()) return std::nullopt;
  return list;
}

void Axctl::printMatches(const value::Dictionary& reply) {
  std::optional<Value> list = matchesIn(reply);
  if (!list) {
    std::printf("no plug-in list in the reply (protocol version %lld)\n",
                static_cast<long long>(client_.protocolVersion()));
    return;
  }
  std::printf("%-40s %-10s %-8s %s\n", "IDENTIFIER", "VERSION", "ELECTION", "PATH");
  for (const Value& element : *list->asArray()) {
    const value::Dictionary* form = element.asDictionary();
    if (!form) continue;
    std::printf("%-40s %-10s %-8s %s\n", textOf(*form, "identifier"), textOf(*form, "version"),
                electionOf(*form).c_str(), textOf(*form, "path"));
  }
}

void Axctl::printField(const value::Dictionary& reply, const char* key) {
  const Value* field = reply.find(key);
  if (!field) {
    std::printf("ok\n");
    return;
  }
  if (const value::Array* array = field->asArray()) {
    for (const Value& element : *array) std::printf("%s\n", lineOf(element).c_str());
    return;
  }
  std::printf("%s\n", lineOf(*field).c_str());
}

int Axctl::add(const std::vector<std::string>& paths) {
  return call([&](AXDaemonClient& c, auto reply) { c.addPlugIns(paths, reply); },
              [](const value::Dictionary&) { std::printf("ok\n"); });
}

int Axctl::remove(const std::vector<std::string>& paths) {
  return call([&](AXDaemonClient& c, auto reply) { c.removePlugIns(paths, reply); },
              [](const value::Dictionary&) { std::printf("ok\n"); });
}

int Axctl::bulk(std::uint64_t flags) {
  return call([&](AXDaemonClient& c, auto reply) { c.bulkPlugins(flags, reply); },
              [](const value::Dictionary&) { std::printf("ok\n"); });
}

int Axctl::match(const std::optional<value::Dictionary>& rule, std::uint64_t flags) {
  return call([&](AXDaemonClient& c, auto reply) { c.matchPlugIns(rule, flags, reply); },
              [this](const value::Dictionary& reply) { printMatches(reply); });
}

int Axctl::ready(const std::vector<value::Uuid>& uuids, std::uint64_t flags) {
  return call([&](AXDaemonClient& c, auto reply) { c.readyPlugIns(uuids, flags, reply); },
              [](const value::Dictionary&) { std::printf("ok\n"); });
}

int Axctl::access(const std::vector<value::Uuid>& uuids, std::uint64_t flags) {
  return call(
      [&](AXDaemonClient& c, auto reply) { c.accessPlugIns(uuids, flags, reply); },
      [this](const value::Dictionary& reply) { printField(reply, AXProtocol::kExtensions); });
}

int Axctl::annotate(const std::vector<value::Uuid>& uuids, const value::Dictionary& annotations) {
  return call(
      [&](AXDaemonClient& c, auto reply) { c.setPluginAnnotations(uuids, annotations, reply); },
      [](const value::Dictionary&) { std::printf("ok\n"); });
}

sigset_t Axctl::endingSignals() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGINT);
  sigaddset(&signals, SIGTERM);
  return signals;
}

void Axctl::blockEndingSignals() {
  sigset_t signals = endingSignals();
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
}

int Axctl::hold(const std::vector<std::string>& paths, std::uint64_t flags) {
  int status =
      call([&](AXDaemonClient& c, auto reply) { c.holdPlugins(paths, flags, reply); },
           [this](const value::Dictionary& reply) { printField(reply, AXProtocol::kUuids); });
  if (status != 0) return status;
  std::fflush(stdout);
  sigset_t signals = endingSignals();
  int received = 0;
  sigwait(&signals, &received);
  return 0;
}

int Axctl::release(const value::Uuid& token) {
  return call([&](AXDaemonClient& c, auto reply) { c.releaseHold(token, reply); },
              [](const value::Dictionary&) { std::printf("ok\n"); });
}

int Axctl::launch(const value::Uuid& uuid, bool wait) {
  std::optional<value::Dictionary> form = discover(uuid);
  if (!form) return 1;
  if (!request([&](AXDaemonClient& c, auto reply) { c.readyPlugIns({uuid}, 0, reply); }, false)) {
    return 1;
  }
  if (wait) {
    // Only the parent ignores them: the launcher starts the child with every signal at default.
    std::signal(SIGINT, SIG_IGN);
    std::signal(SIGQUIT, SIG_IGN);
  }
  os::Result<pid_t> child = AXPlugInLauncher::launch(*form);
  if (!child.ok()) {
    std::fprintf(stderr, "axctl: cannot launch %s: %s\n", uuid.string().c_str(),
                 child.error().message.c_str());
    return 1;
  }
  printPid(child.value(), options_.json);
  return wait ? waitFor(child.value()) : 0;
}

std::optional<value::Dictionary> Axctl::discover(const value::Uuid& uuid) {
  const value::Dictionary rule{{AXD_VENDOR_PREFIX ".uuid", Value::string(uuid.string())}};
  std::optional<value::Dictionary> reply =
      request([&](AXDaemonClient& c, auto r) { c.matchPlugIns(rule, kEveryRecord, r); }, false);
  if (!reply) return std::nullopt;
  std::optional<Value> list = matchesIn(*reply);
  if (!list) {
    std::fprintf(stderr, "axctl: no plug-in list in the reply (protocol version %lld)\n",
                 static_cast<long long>(client_.protocolVersion()));
    return std::nullopt;
  }
  for (const Value& element : *list->asArray()) {
    const value::Dictionary* form = element.asDictionary();
    if (form && hasUuid(*form, uuid)) return *form;
  }
  std::fprintf(stderr, "axctl: no plug-in %s is visible to this process\n", uuid.string().c_str());
  return std::nullopt;
}
