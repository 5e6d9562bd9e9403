#include "platform/zyn/FrameSource.h"

#include <utility>

namespace zyn {

namespace {

std::size_t segmentSize(const FrameSource::Segment& segment) {
  if (const auto* bytes = std::get_if<std::vector<std::uint8_t>>(&segment)) return bytes->size();
  return std::get<std::shared_ptr<const ItemStream>>(segment)->size();
}

}  // namespace

FrameSource::FrameSource(FrameKind kind, std::uint64_t id, std::vector<Segment> segments) {
  std::size_t itemBytes = 0;
  for (const Segment& segment : segments) itemBytes += segmentSize(segment);
  std::vector<std::uint8_t> header;
  valid_ = encodeFrameHeader(kind, id, itemBytes, header);
  size_ = header.size() + itemBytes;
  segments_.reserve(segments.size() + 1);
  segments_.emplace_back(std::move(header));
  for (Segment& segment : segments) segments_.push_back(std::move(segment));
}

void FrameSource::fill(std::vector<std::uint8_t>& out, std::size_t budget) {
  const std::size_t target = out.size() + budget;
  while (!done() && out.size() < target) {
    Segment& segment = segments_[segment_];
    if (const auto* bytes = std::get_if<std::vector<std::uint8_t>>(&segment)) {
      out.insert(out.end(), bytes->begin(), bytes->end());
      ++segment_;
      continue;
    }
    const ItemStream& stream = *std::get<std::shared_ptr<const ItemStream>>(segment);
    while (part_ < stream.parts() && out.size() < target) stream.writePart(part_++, out);
    if (part_ == stream.parts()) {
      ++segment_;
      part_ = 0;
    }
  }
}

}  // namespace zyn
