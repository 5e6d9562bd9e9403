#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <string>
#include <variant>
#include <vector>

#include "platform/value/Value.h"
#include "platform/zyn/Message.h"

namespace zyn {

// The reply to one received message, built field by field and then sent with
// Connection::send(). Not thread-safe: one owner builds it.
class Reply {
 public:
  explicit Reply(const Message& request) : id_(request.id), expected_(request.expectsReply) {}

  void set(std::string key, value::Value v) { fields_[std::move(key)] = std::move(v); }
  // Appends one CBOR item to the vector it is given.
  using ItemWriter = std::function<void(std::vector<std::uint8_t>&)>;
  // Sets |key| to the CBOR item that |writeItem| appends when the reply is encoded (for logs, it
  // may be asked more than once): a large field put together from parts encoded once (a
  // discovery's forms) is written straight into the frame, neither encoded again nor copied.
  void setEncoded(std::string key, ItemWriter writeItem) {
    fields_[std::move(key)] = std::move(writeItem);
  }
  // Removes every field set so far.
  void clear() { fields_.clear(); }
  // The field under |key| set by set(), or null when it is not set or was set encoded.
  const value::Value* find(const std::string& key) const;

  // The reply as one dictionary value, for logs: an encoded field is decoded (a string saying
  // so when it does not decode, which is a bug of its writer).
  value::Value body() const;
  // Appends the body's CBOR item to |out|: what CborCodec::encode(body()) would append.
  void encode(std::vector<std::uint8_t>& out) const;

  std::uint64_t id() const { return id_; }
  // False when the request was sent without expecting a reply: sending then does nothing.
  bool expected() const { return expected_; }

 private:
  using Field = std::variant<value::Value, ItemWriter>;

  std::uint64_t id_;
  bool expected_;
  std::map<std::string, Field> fields_;
};

}  // namespace zyn
