#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

namespace zyn {

// One CBOR item that its owner writes in parts rather than holding it encoded: a field of a reply
// too large to be worth a buffer of its own (a discovery's forms). A connection asks for the
// parts as its socket takes them, so one reply costs a piece of memory, whatever its size.
// Implementations are immutable once handed over, and safe to read from any thread.
class ItemStream {
 public:
  virtual ~ItemStream() = default;

  // The size in bytes of the whole item: a frame's length comes before its item.
  virtual std::size_t size() const = 0;
  // The number of parts; their bytes, in order, are the item.
  virtual std::size_t parts() const = 0;
  // Appends the bytes of part |part| (below parts()) to |out|.
  virtual void writePart(std::size_t part, std::vector<std::uint8_t>& out) const = 0;
};

}  // namespace zyn
