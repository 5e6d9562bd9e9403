#include "bench/BulkFrames.h"

#include <map>
#include <string>

#include "Annexa/AXProtocol.h"
#include "platform/zyn/Frame.h"

using value::Value;

namespace {

std::vector<std::uint8_t> encode(zyn::FrameKind kind, std::uint64_t id, Value body) {
  std::vector<std::uint8_t> bytes;
  zyn::encodeFrame(zyn::Frame{kind, id, std::move(body)}, bytes);
  return bytes;
}

}  // namespace

std::vector<std::uint8_t> BulkFrames::request(std::uint64_t flags, std::uint64_t id) {
  // The same map the client builds, so the keys come out in the same order.
  std::map<std::string, Value> fields{
      {AXProtocol::kRequest, Value::string(AXProtocol::kBulk)},
      {AXProtocol::kVersion, Value::unsignedInteger(AXProtocol::kCurrentVersion)},
      {AXProtocol::kFlags, Value::unsignedInteger(flags)},
  };
  return encode(zyn::FrameKind::Request, id, Value::dictionary(value::Dictionary(fields)));
}

std::vector<std::uint8_t> BulkFrames::reply(std::uint64_t id) {
  return encode(zyn::FrameKind::Reply, id, Value::dictionary(value::Dictionary()));
}
