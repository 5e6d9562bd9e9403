#include "tests/support/BlockingClient.h"

#include <memory>

#include "Annexa/AXProtocol.h"

using value::Value;

std::future<zyn::ReplyOrError> BlockingClient::start(const AXDaemonClient::Request& request) {
  // Shared, so that a reply arriving after a timed-out wait still finds its promise.
  auto promise = std::make_shared<std::promise<zyn::ReplyOrError>>();
  auto future = promise->get_future();
  client_.send(request, [promise](const zyn::ReplyOrError& reply) { promise->set_value(reply); });
  return future;
}

std::optional<zyn::ReplyOrError> BlockingClient::await(std::future<zyn::ReplyOrError>& pending) {
  if (pending.wait_for(kReplyTimeout) != std::future_status::ready) return std::nullopt;
  return pending.get();
}

std::string BlockingClient::outcome(const AXDaemonClient::Request& request) {
  auto pending = start(request);
  return describe(await(pending));
}

std::string BlockingClient::bulk(std::uint64_t flags) {
  AXDaemonClient::Request request = client_.request(AXProtocol::kBulk);
  request[AXProtocol::kFlags] = Value::unsignedInteger(flags);
  return outcome(request);
}

std::string BlockingClient::describe(const std::optional<zyn::ReplyOrError>& reply) {
  if (!reply) return "no reply";
  if (const auto* failure = std::get_if<zyn::ServiceError>(&*reply)) {
    return "service error: " + failure->description;
  }
  const Value& body = std::get<Value>(*reply);
  const value::Dictionary* fields = body.asDictionary();
  if (!fields) return "not a dictionary: " + body.description();
  const Value* code = fields->find(AXProtocol::kErrorCode);
  if (!code) return fields->empty() ? "ok" : "ok " + body.description();
  const Value* message = fields->find(AXProtocol::kError);
  std::string text = code->description();
  if (message) text += ": " + (message->asString() ? *message->asString() : message->description());
  return text;
}
