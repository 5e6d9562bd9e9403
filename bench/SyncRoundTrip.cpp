#include "bench/SyncRoundTrip.h"

#include <future>
#include <memory>

#include "Annexa/AXError.h"
#include "Annexa/AXProtocol.h"

namespace {

bool succeeded(const zyn::ReplyOrError& reply) {
  try {
    return !AXDaemonClient::errorInReply(reply);
  } catch (const AXInternalInconsistency&) {
    return false;
  }
}

// Sends through |send| and waits for what |judge| makes of the reply; nothing when the handler
// was dropped unanswered.
template <typename Send, typename Judge>
std::optional<std::size_t> await(Send send, Judge judge) {
  auto verdict = std::make_shared<std::promise<std::optional<std::size_t>>>();
  std::future<std::optional<std::size_t>> arrived = verdict->get_future();
  send([verdict, judge](const zyn::ReplyOrError& reply) { verdict->set_value(judge(reply)); });
  try {
    return arrived.get();
  } catch (const std::future_error&) {
    return std::nullopt;
  }
}

}  // namespace

bool SyncRoundTrip::bulk(AXDaemonClient& client, std::uint64_t flags) {
  auto send = [&](AXDaemonClient::ReplyHandler handler) {
    client.bulkPlugins(flags, std::move(handler));
  };
  auto judge = [](const zyn::ReplyOrError& reply) -> std::optional<std::size_t> {
    if (!succeeded(reply)) return std::nullopt;
    return 0;
  };
  return await(send, judge).has_value();
}

std::optional<std::size_t> SyncRoundTrip::match(AXDaemonClient& client,
                                                const std::optional<value::Dictionary>& rule,
                                                std::uint64_t flags) {
  auto send = [&](AXDaemonClient::ReplyHandler handler) {
    client.matchPlugIns(rule, flags, std::move(handler));
  };
  auto judge = [&client](const zyn::ReplyOrError& reply) -> std::optional<std::size_t> {
    if (!succeeded(reply)) return std::nullopt;
    const value::Value* body = std::get_if<value::Value>(&reply);
    const value::Dictionary* fields = body ? body->asDictionary() : nullptr;
    const value::Value* matches = fields ? fields->find(AXProtocol::kMatches) : nullptr;
    std::optional<value::Value> list = matches ? client.convertFromZyn(*matches) : std::nullopt;
    const value::Array* forms = list ? list->asArray() : nullptr;
    if (!forms) return std::nullopt;
    return forms->size();
  };
  return await(send, judge);
}
