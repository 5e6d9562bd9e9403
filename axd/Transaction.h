#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "Annexa/AXError.h"
#include "platform/value/Value.h"
#include "platform/zyn/Message.h"
#include "platform/zyn/Reply.h"

class AXDServer;
class AXDZynClient;
namespace zyn {
class Connection;
}

// One request being served, from its arrival to the one reply that ends it. Made on the client's
// connection delivery, then dispatched once on the service queue, where it checks the protocol
// version, picks the handler by request type, and ends with exactly one done() or fail()
// (or, for a client that died, no reply at all). Owned by the work item that runs it.
class Transaction {
 public:
  Transaction(const zyn::Message& request, std::shared_ptr<AXDZynClient> client);

  // Serves the request. Called once, on the service queue.
  void dispatch();

  // Sends the reply with the fields set so far (dropped when the connection is gone).
  void done();
  // Sets "errorcode" (and "error" when there is a message), then done().
  void fail(std::int64_t code, const std::optional<std::string>& message);
  // An Annexa error replies with its own code and message; an error of another domain with
  // |code| and its message.
  void fail(std::int64_t code, const AXError& error);

  const std::shared_ptr<AXDZynClient>& client() const { return client_; }
  const value::Dictionary& request() const { return request_; }
  zyn::Reply& reply() { return reply_; }
  std::uint64_t version() const { return version_; }
  const std::shared_ptr<AXDServer>& server() const;
  std::shared_ptr<zyn::Connection> connection() const;

  // Request handlers: each ends the transaction with exactly one reply.
  void bulkPlugIns();

 private:
  // An integer field of the request; 0 when absent or not an unsigned integer.
  std::uint64_t integerField(const char* key) const;

  const std::shared_ptr<AXDZynClient> client_;
  const value::Dictionary request_;
  zyn::Reply reply_;
  std::uint64_t version_ = 0;
};
