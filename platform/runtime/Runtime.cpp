#include "platform/runtime/Runtime.h"

#include <mutex>

namespace runtime {
namespace {

// A class test that accepts the values of one type.
Class::Test ofType(value::Type type) {
  return [type](const value::Value& v) { return v.type() == type; };
}

}  // namespace

Runtime::Runtime() {
  using value::Type;
  addClass("String", ofType(Type::String));
  addClass("Number", [](const value::Value& v) { return v.isNumber(); });
  addClass("Boolean", ofType(Type::Bool));
  addClass("Data", ofType(Type::Data));
  addClass("Date", ofType(Type::Date));
  addClass("UUID", ofType(Type::Uuid));
  addClass("Array", ofType(Type::Array));
  addClass("Dictionary", ofType(Type::Dictionary));
  addClass("Null", ofType(Type::Null));
}

Runtime& Runtime::shared() {
  static Runtime* runtime = new Runtime;  // never destroyed: threads may outlive main's statics
  return *runtime;
}

std::shared_ptr<const Protocol> Runtime::lookUpProtocol(std::string_view name) const {
  std::shared_lock guard(lock_);
  auto it = protocols_.find(name);
  return it == protocols_.end() ? nullptr : it->second;
}

std::shared_ptr<const Class> Runtime::lookUpClass(std::string_view name) const {
  std::shared_lock guard(lock_);
  auto it = classes_.find(name);
  return it == classes_.end() ? nullptr : it->second;
}

std::shared_ptr<Protocol> Runtime::allocateProtocol(std::string name) const {
  if (lookUpProtocol(name)) return nullptr;
  return std::make_shared<Protocol>(std::move(name));
}

std::shared_ptr<const Protocol> Runtime::registerProtocol(std::shared_ptr<Protocol> protocol) {
  std::string name = protocol->name();
  std::unique_lock guard(lock_);
  auto [entry, inserted] = protocols_.try_emplace(std::move(name), protocol);
  if (inserted) protocol->registered_.store(true, std::memory_order_release);
  return entry->second;
}

std::shared_ptr<const Protocol> Runtime::addProtocol(
    std::string name, std::initializer_list<std::string_view> adopted,
    std::initializer_list<std::string_view> selectors) {
  auto protocol = allocateProtocol(name);
  if (!protocol) return lookUpProtocol(name);
  for (std::string_view adoptedName : adopted) {
    auto adoptedProtocol = lookUpProtocol(adoptedName);
    if (!adoptedProtocol) return nullptr;
    protocol->addProtocol(std::move(adoptedProtocol));
  }
  for (std::string_view selector : selectors) protocol->addSelector(std::string(selector));
  return registerProtocol(std::move(protocol));
}

std::shared_ptr<const Class> Runtime::addClass(std::string name, Class::Test test) {
  auto made = std::make_shared<const Class>(name, std::move(test));
  std::unique_lock guard(lock_);
  return classes_.try_emplace(std::move(name), std::move(made)).first->second;
}

}  // namespace runtime
