#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <variant>
#include <vector>

#include "platform/zyn/Frame.h"
#include "platform/zyn/ItemStream.h"

namespace zyn {

// A frame made of encoded bytes and streamed items, written a piece at a time: the connection
// asks for the next piece when its socket has taken the last, so a large frame never lies in
// memory whole. Not thread-safe: one writer at a time.
class FrameSource {
 public:
  // A run of the item: bytes encoded already, or a stream written part by part.
  using Segment = std::variant<std::vector<std::uint8_t>, std::shared_ptr<const ItemStream>>;

  // The frame of |kind| and |id| whose item is |segments| in order.
  FrameSource(FrameKind kind, std::uint64_t id, std::vector<Segment> segments);

  // False when the frame would be 4 GiB or more, which its length field cannot say: such a
  // frame must not be sent.
  bool valid() const { return valid_; }
  // Bytes of the whole frame, its 4-byte length included.
  std::size_t size() const { return size_; }
  // True once every byte was handed out.
  bool done() const { return segment_ == segments_.size(); }
  // Appends the next bytes to |out|: at least |budget| of them unless the frame ends first (a
  // stream's part is never split, so a piece may run over by less than one part).
  void fill(std::vector<std::uint8_t>& out, std::size_t budget);

 private:
  std::vector<Segment> segments_;
  bool valid_ = false;
  std::size_t size_ = 0;
  std::size_t segment_ = 0;  // the segment to write next
  std::size_t part_ = 0;     // the next part of a stream segment
};

}  // namespace zyn
