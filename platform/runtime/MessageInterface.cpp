#include "platform/runtime/MessageInterface.h"

#include <algorithm>
#include <cerrno>

namespace runtime {
namespace {

std::string slotName(std::string_view selector, int index, bool reply) {
  return "argument " + std::to_string(index) + " of " + (reply ? "the reply to " : "") +
         std::string(selector);
}

os::Status refuse(std::string_view selector, int index, bool reply, const std::string& why) {
  return os::Error{EINVAL, slotName(selector, index, reply) + " " + why};
}

std::string names(const MessageInterface::ClassSet& classes) {
  std::string out;
  for (const auto& c : classes) out += (out.empty() ? "" : ", ") + c->name();
  return out;
}

}  // namespace

void MessageInterface::setClasses(ClassSet classes, std::string_view selector, int index,
                                  bool reply) {
  slots_[Slot(selector, index, reply)] = std::move(classes);
}

void MessageInterface::setInterface(std::shared_ptr<const MessageInterface> nested,
                                    std::string_view selector, int index, bool reply) {
  slots_[Slot(selector, index, reply)] = std::move(nested);
}

const MessageInterface::Setting* MessageInterface::find(std::string_view selector, int index,
                                                        bool reply) const {
  auto it = slots_.find(Slot(selector, index, reply));
  return it == slots_.end() ? nullptr : &it->second;
}

const MessageInterface::ClassSet* MessageInterface::classes(std::string_view selector, int index,
                                                            bool reply) const {
  const Setting* setting = find(selector, index, reply);
  return setting ? std::get_if<ClassSet>(setting) : nullptr;
}

std::shared_ptr<const MessageInterface> MessageInterface::interface(std::string_view selector,
                                                                    int index, bool reply) const {
  const Setting* setting = find(selector, index, reply);
  if (!setting) return nullptr;
  auto nested = std::get_if<std::shared_ptr<const MessageInterface>>(setting);
  return nested ? *nested : nullptr;
}

os::Status MessageInterface::checkSelector(std::string_view selector) const {
  if (protocol_->declares(selector)) return os::success();
  return os::Error{
      EINVAL, "selector " + std::string(selector) + " is not in protocol " + protocol_->name()};
}

os::Status MessageInterface::check(std::string_view selector, int index, bool reply,
                                   const Argument& argument) const {
  os::Status declared = checkSelector(selector);
  return declared.ok() ? checkSlot(selector, index, reply, argument) : declared;
}

os::Status MessageInterface::checkSlot(std::string_view selector, int index, bool reply,
                                       const Argument& argument) const {
  const Setting* setting = find(selector, index, reply);
  const auto& proxy = argument.proxyProtocol();
  if (!setting) {
    if (!proxy) return os::success();
    return refuse(selector, index, reply, "may not be a proxy: no protocol is configured for it");
  }
  if (auto classes = std::get_if<ClassSet>(setting)) {
    const value::Value* value = argument.value();
    bool allowed = value && std::any_of(classes->begin(), classes->end(),
                                        [&](const auto& c) { return c->isInstance(*value); });
    if (allowed) return os::success();
    return refuse(selector, index, reply,
                  "must be one of " + names(*classes) + ", not " + argument.description());
  }
  const auto& nested = std::get<std::shared_ptr<const MessageInterface>>(*setting);
  if (proxy && proxy->conformsTo(*nested->protocol())) return os::success();
  return refuse(
      selector, index, reply,
      "must be a proxy of " + nested->protocol()->name() + ", not " + argument.description());
}

os::Status MessageInterface::checkArguments(std::string_view selector, bool reply,
                                            const std::vector<Argument>& arguments) const {
  os::Status declared = checkSelector(selector);
  if (!declared.ok()) return declared;
  for (std::size_t i = 0; i < arguments.size(); ++i) {
    os::Status status = checkSlot(selector, static_cast<int>(i), reply, arguments[i]);
    if (!status.ok()) return status;
  }
  return os::success();
}

}  // namespace runtime
