#include "bench/MatchFrames.h"

#include <cstring>
#include <map>
#include <string>

#include "Annexa/AXProtocol.h"
#include "platform/value/PlistBridge.h"

using value::Value;

std::vector<std::uint8_t> MatchFrames::request(const std::optional<value::Dictionary>& rule,
                                               std::uint64_t flags, std::uint64_t id) {
  // The same map the client builds, so the keys come out in the same order.
  std::map<std::string, Value> fields{
      {AXProtocol::kRequest, Value::string(AXProtocol::kMatch)},
      {AXProtocol::kVersion, Value::unsignedInteger(AXProtocol::kCurrentVersion)},
      {AXProtocol::kFlags, Value::unsignedInteger(flags)},
  };
  if (rule) fields[AXProtocol::kRules] = value::PlistBridge::toMessage(Value::dictionary(*rule));
  std::vector<std::uint8_t> bytes;
  zyn::encodeFrame(
      zyn::Frame{zyn::FrameKind::Request, id, Value::dictionary(value::Dictionary(fields))}, bytes);
  return bytes;
}

std::optional<zyn::Frame> MatchFrames::decode(std::span<const std::uint8_t> bytes) {
  zyn::FrameDecoder decoder;
  std::memcpy(decoder.prepare(bytes.size()), bytes.data(), bytes.size());
  decoder.commit(bytes.size());
  auto frame = decoder.next();
  if (!frame.ok()) return std::nullopt;
  return std::move(frame).value();
}

std::optional<std::size_t> MatchFrames::forms(const Value& body) {
  // An error reply carries no list.
  const value::Dictionary* fields = body.asDictionary();
  const Value* matches = fields ? fields->find(AXProtocol::kMatches) : nullptr;
  const Value* carried = matches ? matches->asEnvelope() : nullptr;
  const value::Array* list = carried ? carried->asArray() : nullptr;
  if (!list) return std::nullopt;
  return list->size();
}
