#include "platform/registrum/RecordCodec.h"

#include <cerrno>
#include <map>

#include "platform/registrum/RecordFields.h"
#include "platform/value/CborCodec.h"

namespace registrum {

namespace {

using value::Value;

void putString(std::map<std::string, Value>& out, const char* key,
               const std::optional<std::string>& text) {
  if (text) out[key] = Value::string(*text);
}

std::optional<std::string> getString(const value::Dictionary& in, const char* key) {
  return RecordFields::string(in, key);
}

bool getBool(const value::Dictionary& in, const char* key) {
  const Value* found = in.find(key);
  return found && found->asBool().value_or(false);
}

value::Dictionary getDictionary(const value::Dictionary& in, const char* key) {
  const Value* found = in.find(key);
  const value::Dictionary* dictionary = found ? found->asDictionary() : nullptr;
  return dictionary ? *dictionary : value::Dictionary();
}

os::Error malformed(const char* what) {
  return os::Error{EBADMSG, std::string("registry database: malformed ") + what};
}

}  // namespace

std::vector<std::uint8_t> RecordCodec::encodeDictionary(const value::Dictionary& dictionary) {
  std::vector<std::uint8_t> bytes;
  value::CborCodec::encode(Value::dictionary(dictionary), bytes);
  return bytes;
}

os::Result<value::Dictionary> RecordCodec::decodeDictionary(std::span<const std::uint8_t> bytes) {
  os::Result<Value> decoded = value::CborCodec::decode(bytes);
  if (!decoded.ok()) return decoded.error();
  const value::Dictionary* dictionary = decoded.value().asDictionary();
  if (!dictionary) return malformed("dictionary");
  return *dictionary;
}

std::vector<std::uint8_t> RecordCodec::encodeList(const PlugInList& plugIns) {
  value::Array records;
  for (const auto& record : plugIns) records.push_back(encodeRecord(*record));
  std::vector<std::uint8_t> bytes;
  value::CborCodec::encode(Value::array(std::move(records)), bytes);
  return bytes;
}

os::Result<PlugInList> RecordCodec::decodeList(std::span<const std::uint8_t> bytes) {
  os::Result<Value> decoded = value::CborCodec::decode(bytes);
  if (!decoded.ok()) return decoded.error();
  const value::Array* records = decoded.value().asArray();
  if (!records) return malformed("change record list");
  PlugInList plugIns;
  for (const Value& record : *records) {
    const value::Dictionary* encoded = record.asDictionary();
    const Value* uuid = encoded ? encoded->find("uuid") : nullptr;
    if (!uuid || !uuid->asUuid()) return malformed("change record");
    plugIns.push_back(decodeRecord(*encoded));
  }
  return plugIns;
}

Value RecordCodec::encodeRecord(const PlugInRecord& record) {
  const PlugInRecord::Fields& fields = record.fields();
  std::map<std::string, Value> out;
  out["uuid"] = Value::uuid(fields.uuid);
  putString(out, "path", fields.bundlePath);
  if (fields.containingApplication) {
    out["application"] = encodeApplication(*fields.containingApplication);
  }
  out["entitlements"] = Value::dictionary(fields.entitlements);
  out["declaredEntitlements"] = Value::dictionary(fields.declaredEntitlements);
  out["registrationDate"] = Value::real(fields.registrationDate);
  out["onSystemPartition"] = Value::boolean(fields.onSystemPartition);
  putString(out, "dataContainer", fields.dataContainerPath);
  out["plugInDictionary"] = Value::dictionary(fields.plugInDictionary);
  out["info"] = Value::dictionary(fields.infoDictionary);
  return Value::dictionary(value::Dictionary(std::move(out)));
}

std::shared_ptr<const PlugInRecord> RecordCodec::decodeRecord(const value::Dictionary& in) {
  PlugInRecord::Fields fields;
  fields.uuid = *in.find("uuid")->asUuid();
  fields.bundlePath = getString(in, "path");
  fields.containingApplication = decodeApplication(in.find("application"));
  fields.entitlements = getDictionary(in, "entitlements");
  fields.declaredEntitlements = getDictionary(in, "declaredEntitlements");
  const Value* date = in.find("registrationDate");
  fields.registrationDate = date ? date->asReal().value_or(0) : 0;
  fields.onSystemPartition = getBool(in, "onSystemPartition");
  fields.dataContainerPath = getString(in, "dataContainer");
  fields.plugInDictionary = getDictionary(in, "plugInDictionary");
  fields.infoDictionary = getDictionary(in, "info");
  RecordFields::derive(fields);
  return std::make_shared<const PlugInRecord>(std::move(fields));
}

Value RecordCodec::encodeApplication(const ApplicationRecord& application) {
  const ApplicationRecord::Fields& fields = application.fields();
  std::map<std::string, Value> out;
  out["path"] = Value::string(fields.path);
  putString(out, "bundleIdentifier", fields.bundleIdentifier);
  putString(out, "bundleVersion", fields.bundleVersion);
  putString(out, "localizedName", fields.localizedName);
  out["placeholder"] = Value::boolean(fields.placeholder);
  return Value::dictionary(value::Dictionary(std::move(out)));
}

std::shared_ptr<const ApplicationRecord> RecordCodec::decodeApplication(const Value* encoded) {
  const value::Dictionary* in = encoded ? encoded->asDictionary() : nullptr;
  if (!in) return nullptr;
  return std::make_shared<const ApplicationRecord>(ApplicationRecord::Fields{
      .path = getString(*in, "path").value_or(""),
      .bundleIdentifier = getString(*in, "bundleIdentifier"),
      .bundleVersion = getString(*in, "bundleVersion"),
      .localizedName = getString(*in, "localizedName"),
      .placeholder = getBool(*in, "placeholder"),
  });
}

}  // namespace registrum
