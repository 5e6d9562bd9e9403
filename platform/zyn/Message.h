#pragma once

#include <cstdint>
#include <string>
#include <variant>

#include "platform/value/Value.h"

namespace zyn {

// The message service's own errors: the two terminal events of a connection, which also stand in
// for the reply of a request that can no longer be answered, and the refusal of a request too
// large to send.
enum class ErrorKind {
  // The connection is gone: the peer closed it, it broke, or it could not be made.
  ConnectionInvalid,
  // The peer announced an orderly shutdown; the connection still works until it closes.
  TerminationImminent,
  // Only in place of a reply: the request was not sent, its frame being over the limit. The
  // connection goes on.
  MessageTooLarge,
};

struct ServiceError {
  ErrorKind kind;
  std::string description;
};

// One message received on a connection.
struct Message {
  value::Value body;
  std::uint64_t id = 0;
  // False for a one-way message: no reply can be sent for it.
  bool expectsReply = false;
};

// What a connection's event handler receives, one at a time and in order.
using Event = std::variant<Message, ServiceError>;

// What a reply handler receives: the reply's body, or the error that ended the wait.
using ReplyOrError = std::variant<value::Value, ServiceError>;

}  // namespace zyn
