#include "platform/runtime/Argument.h"

namespace runtime {

Argument Argument::proxy(std::shared_ptr<const Protocol> protocol) {
  Argument argument;
  argument.protocol_ = std::move(protocol);
  return argument;
}

std::string Argument::description() const {
  return protocol_ ? "proxy of " + protocol_->name() : value_.description();
}

}  // namespace runtime
