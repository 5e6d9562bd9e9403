#pragma once

#include <initializer_list>
#include <map>
#include <memory>
#include <shared_mutex>
#include <string>
#include <string_view>

#include "platform/runtime/Class.h"
#include "platform/runtime/Protocol.h"

namespace runtime {

// The object runtime: a registry of named protocols and named classes, one per process
// (shared()). Names are unique within each kind and registrations are never undone. Safe for
// concurrent use from any number of threads without external synchronization.
//
// It starts with one class per kind of value: "String", "Number" (any integer or real),
// "Boolean", "Data", "Date", "UUID", "Array", "Dictionary" and "Null".
class Runtime {
 public:
  Runtime();
  Runtime(const Runtime&) = delete;
  Runtime& operator=(const Runtime&) = delete;

  // The process's runtime; it lives until the process exits.
  static Runtime& shared();

  // The registered protocol named |name|, or null when there is none.
  std::shared_ptr<const Protocol> lookUpProtocol(std::string_view name) const;
  // The registered class named |name|, or null when there is none.
  std::shared_ptr<const Class> lookUpClass(std::string_view name) const;

  // A new, unregistered protocol named |name| for the caller to fill and register, or null when
  // a protocol of that name is registered. Allocation reserves nothing: two threads may each
  // allocate the same name, and registration decides between them.
  std::shared_ptr<Protocol> allocateProtocol(std::string name) const;
  // Registers |protocol| (from allocateProtocol) and returns the protocol now registered under
  // its name: |protocol| itself, from then on unchangeable, or the one another thread registered
  // first, so every caller ends up with the same protocol.
  std::shared_ptr<const Protocol> registerProtocol(std::shared_ptr<Protocol> protocol);

  // Registers, in one line of the program that defines it, the protocol |name| adopting the
  // registered protocols named |adopted| and declaring |selectors|. Returns the registered
  // protocol of that name: the new one, or the one registered before, unchanged. Null, with
  // nothing registered, when an adopted name is not registered.
  std::shared_ptr<const Protocol> addProtocol(std::string name,
                                              std::initializer_list<std::string_view> adopted,
                                              std::initializer_list<std::string_view> selectors);
  // Registers the class |name| whose instances are the values that |test| accepts. Returns the
  // registered class of that name: the new one, or the one registered before, unchanged.
  std::shared_ptr<const Class> addClass(std::string name, Class::Test test);

 private:
  mutable std::shared_mutex lock_;
  std::map<std::string, std::shared_ptr<const Protocol>, std::less<>> protocols_;
  std::map<std::string, std::shared_ptr<const Class>, std::less<>> classes_;
};

}  // namespace runtime
