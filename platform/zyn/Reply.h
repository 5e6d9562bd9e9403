#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <variant>
#include <vector>

#include "platform/value/Value.h"
#include "platform/zyn/FrameSource.h"
#include "platform/zyn/ItemStream.h"
#include "platform/zyn/Message.h"

namespace zyn {

// The reply to one received message, built field by field and then sent with
// Connection::send(). Not thread-safe: one owner builds it.
class Reply {
 public:
  explicit Reply(const Message& request) : id_(request.id), expected_(request.expectsReply) {}

  void set(std::string key, value::Value v) { fields_[std::move(key)] = std::move(v); }
  // Sets |key| to an item written in parts as the connection sends it (ItemStream): a large
  // field put together from parts encoded once (a discovery's forms) is neither encoded again
  // nor held whole in a buffer.
  void setStreamed(std::string key, std::shared_ptr<const ItemStream> item) {
    fields_[std::move(key)] = std::move(item);
  }
  // Removes every field set so far.
  void clear() { fields_.clear(); }
  // The field under |key| set by set(), or null when it is not set or was set streamed.
  const value::Value* find(const std::string& key) const;
  // True when a field was set streamed.
  bool streamed() const;

  // The reply as one dictionary value, for logs: a streamed field is decoded (a string saying
  // so when it does not decode, which is a bug of its writer).
  value::Value body() const;
  // Appends the body's CBOR item to |out|, streamed fields written whole.
  void encode(std::vector<std::uint8_t>& out) const;
  // The body's CBOR item as runs of encoded bytes and the streamed fields, for a FrameSource.
  std::vector<FrameSource::Segment> segments() const;

  std::uint64_t id() const { return id_; }
  // False when the request was sent without expecting a reply: sending then does nothing.
  bool expected() const { return expected_; }

 private:
  using Field = std::variant<value::Value, std::shared_ptr<const ItemStream>>;

  std::uint64_t id_;
  bool expected_;
  std::map<std::string, Field> fields_;
};

}  // namespace zyn
