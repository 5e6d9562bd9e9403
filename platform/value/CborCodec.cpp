#include "platform/value/CborCodec.h"

#include <cbor.h>

#include <cerrno>

#include "platform/os/Format.h"
#include "platform/value/CborBuilder.h"
#include "platform/value/Utf8.h"

namespace value {

namespace {

using Out = std::vector<std::uint8_t>;

// Appends a head that libcbor's encoder |encode| writes for |argument|.
template <typename Argument>
void head(Out& out, std::size_t (*encode)(Argument, unsigned char*, std::size_t),
          Argument argument) {
  unsigned char bytes[9];
  std::size_t length = encode(argument, bytes, sizeof bytes);
  out.insert(out.end(), bytes, bytes + length);
}

void textString(Out& out, std::string_view s) {
  if (!Utf8::valid(s)) return textString(out, Utf8::repaired(s));
  head<std::size_t>(out, cbor_encode_string_start, s.size());
  out.insert(out.end(), s.begin(), s.end());
}

void byteString(Out& out, const std::uint8_t* data, std::size_t length) {
  head<std::size_t>(out, cbor_encode_bytestring_start, length);
  out.insert(out.end(), data, data + length);
}

void integer(Out& out, std::int64_t i) {
  if (i < 0) {
    return head<std::uint64_t>(out, cbor_encode_negint, static_cast<std::uint64_t>(-(i + 1)));
  }
  head<std::uint64_t>(out, cbor_encode_tag, CborCodec::kTagSignedInteger);
  head<std::uint64_t>(out, cbor_encode_uint, static_cast<std::uint64_t>(i));
}

void container(Out& out, const Value& value) {
  if (const Array* array = value.asArray()) {
    head<std::size_t>(out, cbor_encode_array_start, array->size());
    for (const Value& element : *array) CborCodec::encode(element, out);
    return;
  }
  const Dictionary& dictionary = *value.asDictionary();
  head<std::size_t>(out, cbor_encode_map_start, dictionary.size());
  for (const auto& [key, element] : dictionary) {
    textString(out, key);
    CborCodec::encode(element, out);
  }
}

CborBuilder* b(void* context) {
  return static_cast<CborBuilder*>(context);
}

// libcbor's streaming decoder reports one event per call to these; each forwards to the builder.
const cbor_callbacks& callbacks() {
  static const cbor_callbacks kCallbacks = [] {
    cbor_callbacks c = cbor_empty_callbacks;
    c.uint8 = [](void* x, std::uint8_t u) { b(x)->unsignedInteger(u); };
    c.uint16 = [](void* x, std::uint16_t u) { b(x)->unsignedInteger(u); };
    c.uint32 = [](void* x, std::uint32_t u) { b(x)->unsignedInteger(u); };
    c.uint64 = [](void* x, std::uint64_t u) { b(x)->unsignedInteger(u); };
    c.negint8 = [](void* x, std::uint8_t n) { b(x)->negativeInteger(n); };
    c.negint16 = [](void* x, std::uint16_t n) { b(x)->negativeInteger(n); };
    c.negint32 = [](void* x, std::uint32_t n) { b(x)->negativeInteger(n); };
    c.negint64 = [](void* x, std::uint64_t n) { b(x)->negativeInteger(n); };
    c.byte_string = [](void* x, cbor_data d, std::size_t n) { b(x)->byteString(d, n); };
    c.byte_string_start = [](void* x) { b(x)->startChunkedBytes(); };
    c.string = [](void* x, cbor_data d, std::size_t n) { b(x)->textString(d, n); };
    c.string_start = [](void* x) { b(x)->startChunkedText(); };
    c.array_start = [](void* x, std::size_t n) { b(x)->startArray(n); };
    c.indef_array_start = [](void* x) { b(x)->startArray(std::nullopt); };
    c.map_start = [](void* x, std::size_t n) { b(x)->startMap(n); };
    c.indef_map_start = [](void* x) { b(x)->startMap(std::nullopt); };
    c.tag = [](void* x, std::uint64_t t) { b(x)->tag(t); };
    c.float2 = [](void* x, float f) { b(x)->real(f); };
    c.float4 = [](void* x, float f) { b(x)->real(f); };
    c.float8 = [](void* x, double d) { b(x)->real(d); };
    c.undefined = [](void* x) { b(x)->unsupported("undefined"); };
    c.null = [](void* x) { b(x)->null(); };
    c.boolean = [](void* x, bool v) { b(x)->boolean(v); };
    c.indef_break = [](void* x) { b(x)->endIndefinite(); };
    return c;
  }();
  return kCallbacks;
}

os::Error malformed(std::string what, std::size_t offset) {
  return os::Error{EBADMSG, os::format("bad CBOR at byte %u: %s", {offset, what})};
}

}  // namespace

void CborCodec::encode(const Value& value, Out& out) {
  switch (value.type()) {
    case Type::Null:
      return out.push_back(0xF6);
    case Type::Bool:
      return out.push_back(*value.asBool() ? 0xF5 : 0xF4);
    case Type::Int:
      return integer(out, *value.asInt());
    case Type::UInt:
      return head<std::uint64_t>(out, cbor_encode_uint, *value.asUInt());
    case Type::Real:
      return head<double>(out, cbor_encode_double, *value.asReal());
    case Type::String:
      return textString(out, *value.asString());
    case Type::Data:
      return byteString(out, value.asData()->data(), value.asData()->size());
    case Type::Date:
      head<std::uint64_t>(out, cbor_encode_tag, kTagDate);
      return head<double>(out, cbor_encode_double, value.asDate()->seconds);
    case Type::Uuid:
      head<std::uint64_t>(out, cbor_encode_tag, kTagUuid);
      return byteString(out, value.asUuid()->bytes().data(), value.asUuid()->bytes().size());
    case Type::Array:
    case Type::Dictionary:
      return container(out, value);
    case Type::Envelope:
      head<std::uint64_t>(out, cbor_encode_tag, kTagEnvelope);
      return encode(*value.asEnvelope(), out);
  }
}

void CborCodec::encodeArrayHead(std::size_t count, Out& out) {
  head<std::size_t>(out, cbor_encode_array_start, count);
}

void CborCodec::encodeMapHead(std::size_t count, Out& out) {
  head<std::size_t>(out, cbor_encode_map_start, count);
}

void CborCodec::encodeTag(std::uint64_t tag, Out& out) {
  head<std::uint64_t>(out, cbor_encode_tag, tag);
}

void CborCodec::encodeText(std::string_view text, Out& out) {
  textString(out, text);
}

os::Result<Value> CborCodec::decode(std::span<const std::uint8_t> bytes, std::size_t maxDepth,
                                    std::size_t maxItems) {
  CborBuilder builder(maxDepth, maxItems);
  std::size_t offset = 0;
  while (!builder.done()) {
    std::size_t left = bytes.size() - offset;
    if (left == 0) return malformed("the input ends inside an item", offset);
    builder.setBytesLeft(left);
    cbor_decoder_result step =
        cbor_stream_decode(bytes.data() + offset, left, &callbacks(), &builder);
    if (step.status == CBOR_DECODER_NEDATA)
      return malformed("the input ends inside an item", offset);
    if (step.status == CBOR_DECODER_ERROR) {
      return malformed(os::format("malformed or unsupported initial byte 0x%x", {bytes[offset]}),
                       offset);
    }
    if (builder.failed()) return malformed(builder.error(), offset);
    offset += step.read;
  }
  if (offset != bytes.size()) {
    return malformed(os::format("%u bytes follow the item", {bytes.size() - offset}), offset);
  }
  return builder.take();
}

}  // namespace value
