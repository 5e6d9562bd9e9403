#pragma once

#include <memory>

#include "platform/runtime/Protocol.h"
#include "platform/value/Value.h"

namespace runtime {

// One argument of a message as a message interface sees it: a value, or a proxy that stands for
// an object on the other side of the connection, speaking a protocol. Immutable; cheap to copy.
class Argument {
 public:
  // A value argument.
  Argument(value::Value value) : value_(std::move(value)) {}
  // A proxy argument; |protocol| must not be null.
  static Argument proxy(std::shared_ptr<const Protocol> protocol);

  // The value, or null for a proxy.
  const value::Value* value() const { return protocol_ ? nullptr : &value_; }
  // The proxy's protocol, or null for a value.
  const std::shared_ptr<const Protocol>& proxyProtocol() const { return protocol_; }

  // The value's description, or "proxy of <protocol name>", for messages.
  std::string description() const;

 private:
  Argument() = default;

  value::Value value_;
  std::shared_ptr<const Protocol> protocol_;
};

}  // namespace runtime
