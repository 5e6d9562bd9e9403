#include "platform/value/CborBuilder.h"

#include <algorithm>
#include <cstdint>
#include <iterator>
#include <utility>

#include "platform/os/Format.h"
#include "platform/value/CborCodec.h"
#include "platform/value/Utf8.h"

namespace value {

const std::string& CborBuilder::error() const {
  static const std::string kNone;
  return error_ ? *error_ : kNone;
}

void CborBuilder::unsignedInteger(std::uint64_t u) {
  if (!admit(Item::UInt)) return;
  auto tag = takeTag();
  if (tag == CborCodec::kTagDate) return deliver(Value::date({static_cast<double>(u)}));
  if (tag != CborCodec::kTagSignedInteger) return deliver(Value::unsignedInteger(u));
  if (u > INT64_MAX) return fail(os::format("signed integer %u is out of range", {u}));
  deliver(Value::integer(static_cast<std::int64_t>(u)));
}

void CborBuilder::negativeInteger(std::uint64_t n) {
  if (!admit(Item::NegInt)) return;
  if (n > INT64_MAX) return fail("negative integer below -2^63 is out of range");
  std::int64_t i = -1 - static_cast<std::int64_t>(n);
  if (takeTag() == CborCodec::kTagDate) return deliver(Value::date({static_cast<double>(i)}));
  deliver(Value::integer(i));
}

void CborBuilder::real(double d) {
  if (!admit(Item::Float)) return;
  if (takeTag() == CborCodec::kTagDate) return deliver(Value::date({d}));
  deliver(Value::real(d));
}

void CborBuilder::boolean(bool b) {
  if (admit(Item::Other)) deliver(Value::boolean(b));
}

void CborBuilder::null() {
  if (admit(Item::Other)) deliver(Value());
}

void CborBuilder::byteString(const std::uint8_t* bytes, std::size_t length) {
  if (!admit(Item::Bytes)) return;
  if (!stack_.empty() && stack_.back().kind == Kind::ChunkedBytes) {
    chunks_.append(reinterpret_cast<const char*>(bytes), length);
    return;
  }
  if (takeTag() != CborCodec::kTagUuid) return deliver(Value::data(Data(bytes, bytes + length)));
  Uuid::Bytes uuid;
  if (length != uuid.size()) return fail("tag 37 must enclose a 16-byte byte string");
  std::copy(bytes, bytes + length, uuid.begin());
  deliver(Value::uuid(Uuid(uuid)));
}

void CborBuilder::textString(const std::uint8_t* bytes, std::size_t length) {
  if (!admit(Item::Text)) return;
  std::string_view text(reinterpret_cast<const char*>(bytes), length);
  if (!stack_.empty() && stack_.back().kind == Kind::ChunkedText) {
    chunks_ += text;
    return;
  }
  if (!Utf8::valid(text)) return fail("text string is not valid UTF-8");
  if (awaitsKey()) return deliverKey(text);
  deliver(Value::string(std::string(text)));
}

void CborBuilder::startChunkedBytes() {
  startChunked(Kind::ChunkedBytes);
}

void CborBuilder::startChunkedText() {
  startChunked(Kind::ChunkedText);
}

void CborBuilder::startArray(std::optional<std::uint64_t> count) {
  if (admit(Item::Other)) startContainer(Kind::Array, count);
}

void CborBuilder::startMap(std::optional<std::uint64_t> count) {
  if (!admit(Item::Other)) return;
  // A map of n pairs holds 2n items, each at least one byte long.
  if (count && *count > bytesLeft_ / 2)
    return fail("map declares more entries than the input holds");
  startContainer(Kind::Map, count);
}

void CborBuilder::tag(std::uint64_t number) {
  if (!admit(Item::Other)) return;
  if (number == CborCodec::kTagEnvelope) return startContainer(Kind::Envelope, 1);
  if (number != CborCodec::kTagDate && number != CborCodec::kTagUuid &&
      number != CborCodec::kTagSignedInteger) {
    return fail(os::format("unsupported tag %u", {number}));
  }
  pendingTag_ = number;
}

void CborBuilder::endIndefinite() {
  if (failed()) return;
  if (stack_.empty() || !stack_.back().indefinite || pendingTag_ || stack_.back().keyed) {
    return fail("unexpected break");
  }
  Value value = finish(stack_.back());
  if (failed()) return;
  stack_.pop_back();
  deliver(std::move(value));
}

void CborBuilder::unsupported(const char* what) {
  if (!failed()) fail(os::format("%s has no counterpart among values", {what}));
}

// Whether an item of kind |item| may come next: inside a chunked string only chunks of its own
// type, and under a pending tag only what that tag encloses.
bool CborBuilder::admit(Item item) {
  if (failed()) return false;
  if (!stack_.empty()) {
    Kind kind = stack_.back().kind;
    if ((kind == Kind::ChunkedBytes && item != Item::Bytes) ||
        (kind == Kind::ChunkedText && item != Item::Text)) {
      fail("an indefinite-length string holds something other than definite chunks of its type");
      return false;
    }
  }
  if (!pendingTag_) return true;
  bool fits = (*pendingTag_ == CborCodec::kTagUuid && item == Item::Bytes) ||
              (*pendingTag_ == CborCodec::kTagSignedInteger && item == Item::UInt) ||
              (*pendingTag_ == CborCodec::kTagDate &&
               (item == Item::UInt || item == Item::NegInt || item == Item::Float));
  if (!fits) fail(os::format("tag %u encloses an item of the wrong type", {*pendingTag_}));
  return fits;
}

std::optional<std::uint64_t> CborBuilder::takeTag() {
  return std::exchange(pendingTag_, std::nullopt);
}

void CborBuilder::startContainer(Kind kind, std::optional<std::uint64_t> items) {
  if (depth_ == maxDepth_) return fail(os::format("items nest deeper than %u", {maxDepth_}));
  if (items && *items > bytesLeft_)
    return fail("array declares more elements than the input holds");
  if (items == 0u) return deliver(kind == Kind::Array ? Value::array({}) : Value::dictionary({}));
  ++depth_;
  if (kind == Kind::Map) maps_.open();
  stack_.push_back(Open{kind, !items, false, items.value_or(0), values_.size()});
}

void CborBuilder::startChunked(Kind kind) {
  if (!admit(Item::Other)) return;
  chunks_.clear();
  stack_.push_back(Open{kind, true});
}

bool CborBuilder::awaitsKey() const {
  return !stack_.empty() && stack_.back().kind == Kind::Map && !stack_.back().keyed;
}

// A key in plain text goes straight into its map's entry: it never becomes a value of its own.
void CborBuilder::deliverKey(std::string_view key) {
  if (counted()) addKey(stack_.back(), key);
}

// Counts one more finished item; false, recording the error, past the limit.
bool CborBuilder::counted() {
  if (++items_ <= maxItems_) return true;
  fail(os::format("more than %u items", {maxItems_}));
  return false;
}

// Hands a finished item to the innermost open container, closing every container it completes.
void CborBuilder::deliver(Value&& value) {
  if (!counted()) return;
  while (!stack_.empty()) {
    if (!add(stack_.back(), std::move(value))) return;
    value = finish(stack_.back());
    stack_.pop_back();
  }
  result_ = std::move(value);
}

// Adds |value| to |open|; true when that completes it. A definite map counts its entries down.
bool CborBuilder::add(Open& open, Value&& value) {
  if (open.kind == Kind::Map && !open.keyed) {
    // Plain text keys take deliverKey(); a key that comes here was chunked or is not text.
    const std::string* key = value.asString();
    if (!key) {
      fail("map key is not a text string");
      return false;
    }
    addKey(open, *key);
    return false;
  }
  if (open.kind == Kind::Map) {
    maps_.setValue(std::move(value));
    open.keyed = false;
  } else {
    values_.push_back(std::move(value));
  }
  return open.kind == Kind::Envelope || (!open.indefinite && --open.remaining == 0);
}

void CborBuilder::addKey(Open& open, std::string_view key) {
  if (!maps_.addKey(key)) return fail("duplicate map key \"" + std::string(key) + "\"");
  open.keyed = true;
}

// The value of a complete container or chunked string; records an error for chunked text that
// is not valid UTF-8.
Value CborBuilder::finish(Open& open) {
  switch (open.kind) {
    case Kind::ChunkedBytes:
      return Value::data(Data(chunks_.begin(), chunks_.end()));
    case Kind::ChunkedText:
      if (!Utf8::valid(chunks_)) fail("text string is not valid UTF-8");
      return Value::string(std::move(chunks_));
    case Kind::Array:
      --depth_;
      return Value::array(takeValues(open.first));
    case Kind::Map:
      --depth_;
      return Value::dictionary(maps_.close());
    case Kind::Envelope:
      --depth_;
      return Value::envelope(takeLast());
  }
  return Value();
}

// The elements from |first| on, moved into an array of exactly their number.
Array CborBuilder::takeValues(std::size_t first) {
  auto begin = values_.begin() + static_cast<std::ptrdiff_t>(first);
  Array elements(std::make_move_iterator(begin), std::make_move_iterator(values_.end()));
  values_.erase(begin, values_.end());
  return elements;
}

Value CborBuilder::takeLast() {
  Value last = std::move(values_.back());
  values_.pop_back();
  return last;
}

void CborBuilder::fail(std::string message) {
  if (!error_) error_ = std::move(message);
}

}  // namespace value
