#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/value/OpenMaps.h"
#include "platform/value/Value.h"

namespace value {

// Builds one Value from the events of libcbor's streaming decoder, keeping open containers on an
// explicit stack so that deep input cannot exhaust the call stack. Used by CborCodec; one
// builder per decode, not thread-safe.
//
// Every event either advances the value or records the first error; after an error the builder
// ignores further events.
class CborBuilder {
 public:
  // A builder of at most |maxItems| items (scalars and containers alike) nested at most
  // |maxDepth| deep.
  CborBuilder(std::size_t maxDepth, std::size_t maxItems)
      : maxDepth_(maxDepth), maxItems_(maxItems) {}

  // The number of input bytes that remain, counting the current item's head; counts that
  // declare more elements than this are refused before anything is allocated for them.
  void setBytesLeft(std::size_t bytesLeft) { bytesLeft_ = bytesLeft; }

  void unsignedInteger(std::uint64_t u);
  // The integer -1 - |n|, as CBOR's major type 1 carries it.
  void negativeInteger(std::uint64_t n);
  void real(double d);
  void boolean(bool b);
  void null();
  void byteString(const std::uint8_t* bytes, std::size_t length);
  void textString(const std::uint8_t* bytes, std::size_t length);
  void startChunkedBytes();
  void startChunkedText();
  // |count| is nothing for an indefinite-length container.
  void startArray(std::optional<std::uint64_t> count);
  void startMap(std::optional<std::uint64_t> count);
  void tag(std::uint64_t number);
  void endIndefinite();
  // An item that has no counterpart in the value model, described by |what|.
  void unsupported(const char* what);

  bool failed() const { return error_.has_value(); }
  // The first error; empty while there is none.
  const std::string& error() const;
  // True once the top-level item is complete and no error occurred.
  bool done() const { return result_.has_value() && !failed(); }
  // The finished value; only after done().
  Value take() { return std::move(*result_); }

 private:
  enum class Item { UInt, NegInt, Float, Bytes, Text, Other };
  enum class Kind { Array, Map, Envelope, ChunkedBytes, ChunkedText };

  // An open container or chunked string. What it holds so far waits in the builder's shared
  // lists: an array's or envelope's elements in values_ from |first| on, a map's entries in
  // maps_, a chunked string's chunks in chunks_ (chunked strings do not nest). So opening one
  // allocates nothing.
  struct Open {
    Kind kind;
    bool indefinite = false;
    bool keyed = false;           // A map whose last entry has its key but not yet its value.
    std::uint64_t remaining = 0;  // Elements or entries still due in a definite container.
    std::size_t first = 0;
  };

  bool admit(Item item);
  std::optional<std::uint64_t> takeTag();
  void startContainer(Kind kind, std::optional<std::uint64_t> items);
  void startChunked(Kind kind);
  bool awaitsKey() const;
  void deliverKey(std::string_view key);
  bool counted();
  void deliver(Value&& value);
  bool add(Open& open, Value&& value);
  void addKey(Open& open, std::string_view key);
  Value finish(Open& open);
  Array takeValues(std::size_t first);
  Value takeLast();
  void fail(std::string message);

  std::size_t maxDepth_;
  std::size_t maxItems_;
  std::size_t items_ = 0;  // Items finished so far.
  std::size_t depth_ = 0;  // Open arrays, maps and envelopes.
  std::size_t bytesLeft_ = 0;
  std::optional<std::uint64_t> pendingTag_;
  std::vector<Open> stack_;
  std::vector<Value> values_;
  OpenMaps maps_;
  std::string chunks_;
  std::optional<Value> result_;
  std::optional<std::string> error_;
};

}  // namespace value
