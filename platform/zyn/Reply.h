#pragma once

#include <cstdint>
#include <map>
#include <string>

#include "platform/value/Value.h"
#include "platform/zyn/Message.h"

namespace zyn {

// The reply to one received message, built field by field and then sent with
// Connection::send(). Not thread-safe: one owner builds it.
class Reply {
 public:
  explicit Reply(const Message& request) : id_(request.id), expected_(request.expectsReply) {}

  void set(std::string key, value::Value v) { fields_[std::move(key)] = std::move(v); }
  // Removes every field set so far.
  void clear() { fields_.clear(); }
  // The field under |key|, or null when it is not set.
  const value::Value* find(const std::string& key) const;

  // The reply as one dictionary value.
  value::Value body() const { return value::Value::dictionary(value::Dictionary(fields_)); }

  std::uint64_t id() const { return id_; }
  // False when the request was sent without expecting a reply: sending then does nothing.
  bool expected() const { return expected_; }

 private:
  std::uint64_t id_;
  bool expected_;
  std::map<std::string, value::Value> fields_;
};

}  // namespace zyn
