#include "tools/axctl/Axctl.h"

#include <cstdio>
#include <future>
#include <iostream>

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

}  // namespace

Axctl::Axctl(const Options& options)
    : options_(options), client_(options.serviceName ? options.serviceName->c_str() : nullptr) {
  if (options.protocolVersion) client_.setProtocolVersion(*options.protocolVersion);
}

int Axctl::call(const Send& send, const Print& print) {
  std::promise<zyn::ReplyOrError> promise;
  auto future = promise.get_future();
  send(client_, [&promise](const zyn::ReplyOrError& reply) { promise.set_value(reply); });
  zyn::ReplyOrError reply = future.get();
  std::optional<AXError> error;
  try {
    error = AXDaemonClient::errorInReply(reply);
  } catch (const AXInternalInconsistency& breach) {
    std::fprintf(stderr, "axctl: %s\n", breach.what());
    return 1;
  }
  const Value* body = std::get_if<Value>(&reply);
  if (options_.json) {
    if (body) {
      std::cout << toJson(*body).dump(2) << "\n";
    } else {
      std::cout << toJson(Value::dictionary(
                              {{AXProtocol::kErrorCode, Value::integer(error->code())},
                               {AXProtocol::kError,
                                Value::string(error->localizedDescription().value_or(""))}}))
                       .dump(2)
                << "\n";
    }
  }
  if (error) {
    std::fprintf(stderr, "axctl: error %lld: %s\n", static_cast<long long>(error->code()),
                 error->localizedDescription().value_or("").c_str());
    return 1;
  }
  if (!options_.json) print(*body->asDictionary());
  return 0;
}

void Axctl::printMatches(const value::Dictionary& reply) {
  const Value* matches = reply.find(AXProtocol::kMatches);
  std::optional<Value> list = matches ? client_.convertFromZyn(*matches) : std::nullopt;
  if (!list || !list->asArray()) {
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
    for (const Value& element : *array) std::printf("%s\n", toJson(element).dump().c_str());
    return;
  }
  std::printf("%s\n",
              field->asUuid() ? field->asUuid()->string().c_str() : toJson(*field).dump().c_str());
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

int Axctl::hold(const std::vector<std::string>& paths, std::uint64_t flags) {
  return call([&](AXDaemonClient& c, auto reply) { c.holdPlugins(paths, flags, reply); },
              [this](const value::Dictionary& reply) { printField(reply, AXProtocol::kUuids); });
}

int Axctl::release(const value::Uuid& token) {
  return call([&](AXDaemonClient& c, auto reply) { c.releaseHold(token, reply); },
              [](const value::Dictionary&) { std::printf("ok\n"); });
}
