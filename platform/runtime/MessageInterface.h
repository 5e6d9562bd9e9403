#pragma once

#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <tuple>
#include <variant>
#include <vector>

#include "platform/os/Error.h"
#include "platform/runtime/Argument.h"
#include "platform/runtime/Class.h"
#include "platform/runtime/Protocol.h"

namespace runtime {

// What a connection may carry for one protocol: for each selector, argument index and direction
// (the message itself, or its reply) either the set of classes an argument may be an instance
// of, or a nested interface that a proxy argument must speak. A slot holds one or the other;
// setting one replaces what the slot held.
//
// Not synchronized: configure an interface on one thread, then share it; the const methods may
// then run on any number of threads at once.
class MessageInterface {
 public:
  using ClassSet = std::vector<std::shared_ptr<const Class>>;

  // An interface of |protocol| with no slot configured; |protocol| must not be null.
  explicit MessageInterface(std::shared_ptr<const Protocol> protocol)
      : protocol_(std::move(protocol)) {}

  const std::shared_ptr<const Protocol>& protocol() const { return protocol_; }

  void setClasses(ClassSet classes, std::string_view selector, int index, bool reply);
  void setInterface(std::shared_ptr<const MessageInterface> nested, std::string_view selector,
                    int index, bool reply);

  // The slot's allowed classes, or null when it holds none (unconfigured, or a nested
  // interface). The pointer lives until the slot is next set.
  const ClassSet* classes(std::string_view selector, int index, bool reply) const;
  // The slot's nested interface, or null when it holds none.
  std::shared_ptr<const MessageInterface> interface(std::string_view selector, int index,
                                                    bool reply) const;

  // Whether |argument| may travel at |index| of |selector|'s message (or its reply): the
  // protocol must declare the selector; a slot with classes takes a value that is an instance of
  // one of them; a slot with a nested interface takes a proxy whose protocol conforms to the
  // nested interface's protocol; an unconfigured slot takes any value but no proxy, since a
  // proxy hands the other side an object to call. A refusal is EINVAL with a message that names
  // the selector, the index and the reason.
  os::Status check(std::string_view selector, int index, bool reply,
                   const Argument& argument) const;
  // check() for each argument of one message, in order (a message without arguments still needs
  // a declared selector); the first refusal is returned.
  os::Status checkArguments(std::string_view selector, bool reply,
                            const std::vector<Argument>& arguments) const;

 private:
  using Slot = std::tuple<std::string, int, bool>;
  using Setting = std::variant<ClassSet, std::shared_ptr<const MessageInterface>>;

  os::Status checkSelector(std::string_view selector) const;
  // check() without the selector's check.
  os::Status checkSlot(std::string_view selector, int index, bool reply,
                       const Argument& argument) const;
  const Setting* find(std::string_view selector, int index, bool reply) const;

  std::shared_ptr<const Protocol> protocol_;
  std::map<Slot, Setting> slots_;
};

}  // namespace runtime
