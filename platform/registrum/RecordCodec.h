#pragma once

#include <cstdint>
#include <span>
#include <vector>

#include "platform/os/Error.h"
#include "platform/registrum/Observer.h"
#include "platform/value/Value.h"

namespace registrum {

// The byte forms the registry stores: dictionaries as CBOR (value::CborCodec), and lists of
// whole plug-in records, their application included, as the payload of a change-log entry.
// Stateless; safe to call from any thread.
class RecordCodec {
 public:
  static std::vector<std::uint8_t> encodeDictionary(const value::Dictionary& dictionary);
  // The dictionary in |bytes|; EBADMSG when they hold no CBOR dictionary.
  static os::Result<value::Dictionary> decodeDictionary(std::span<const std::uint8_t> bytes);

  static std::vector<std::uint8_t> encodeList(const PlugInList& plugIns);
  // The records in |bytes|; EBADMSG when they are not a list that encodeList made.
  static os::Result<PlugInList> decodeList(std::span<const std::uint8_t> bytes);

 private:
  static value::Value encodeRecord(const PlugInRecord& record);
  static std::shared_ptr<const PlugInRecord> decodeRecord(const value::Dictionary& encoded);
  static value::Value encodeApplication(const ApplicationRecord& application);
  static std::shared_ptr<const ApplicationRecord> decodeApplication(const value::Value* encoded);
};

}  // namespace registrum
