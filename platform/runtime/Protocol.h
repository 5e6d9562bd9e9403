#pragma once

#include <atomic>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

namespace runtime {

// A named protocol: the protocols it adopts and the selectors it declares itself.
//
// A new protocol (Runtime::allocateProtocol) belongs to the thread that made it, which may add
// adopted protocols and selectors until it hands the protocol to Runtime::registerProtocol. From
// then on the protocol refuses changes and is safe to read from any thread.
class Protocol {
 public:
  explicit Protocol(std::string name) : name_(std::move(name)) {}
  Protocol(const Protocol&) = delete;
  Protocol& operator=(const Protocol&) = delete;

  const std::string& name() const { return name_; }
  // Adopted protocols in the order they were added.
  const std::vector<std::shared_ptr<const Protocol>>& adoptedProtocols() const { return adopted_; }
  // The selectors this protocol declares itself, without those of adopted protocols.
  const std::vector<std::string>& selectors() const { return selectors_; }

  // Adds |adopted|. Returns false, changing nothing, when this protocol is registered (it no
  // longer changes) or |adopted| is not (so adoption never makes a cycle). Adding one twice
  // changes nothing.
  bool addProtocol(std::shared_ptr<const Protocol> adopted);
  // Declares |selector|; declaring one twice changes nothing. Returns false, changing nothing,
  // when this protocol is registered.
  bool addSelector(std::string selector);

  // True once Runtime::registerProtocol has registered this protocol.
  bool isRegistered() const { return registered_.load(std::memory_order_acquire); }

  // True when this is |other| or adopts it, directly or through its adopted protocols.
  bool conformsTo(const Protocol& other) const;
  // True when this protocol or one it adopts, at any depth, declares |selector|.
  bool declares(std::string_view selector) const;

 private:
  friend class Runtime;

  std::atomic<bool> registered_{false};
  std::string name_;
  std::vector<std::shared_ptr<const Protocol>> adopted_;
  std::vector<std::string> selectors_;
};

}  // namespace runtime
