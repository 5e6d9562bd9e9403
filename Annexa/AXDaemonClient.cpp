#include "Annexa/AXDaemonClient.h"

#include "Annexa/AXProtocol.h"
#include "platform/os/Format.h"
#include "platform/os/Log.h"
#include "platform/value/PlistBridge.h"

using value::Value;

namespace {

Value pathsValue(const std::vector<std::string>& paths) {
  value::Array array;
  array.reserve(paths.size());
  for (const auto& path : paths) array.push_back(Value::string(path));
  return value::PlistBridge::toMessage(Value::array(std::move(array)));
}

}  // namespace

AXDaemonClient::AXDaemonClient(const char* serviceName)
    : replyQueue_(std::make_shared<zyn::StrandQueue>(
          "axd_client", std::make_shared<zyn::EventLoop>("axd_client"))),
      axd_(zyn::Connection::toService(serviceName ? serviceName : defaultServiceName(),
                                      replyQueue_)) {
  axd_->setEventHandler([](const zyn::Event& event) {
    const auto* error = std::get_if<zyn::ServiceError>(&event);
    os::Log::write(5, os::format("Communications error: %@",
                                 {error ? error->description : std::string("(message)")}));
  });
  protocolVersion_.store(static_cast<std::int64_t>(AXProtocol::kCurrentVersion));
  axd_->resume();
}

AXDaemonClient::~AXDaemonClient() {
  axd_->cancel();
}

std::string AXDaemonClient::defaultServiceName() {
  return std::string(AXD_VENDOR_PREFIX) + ".annexa.axd";
}

AXDaemonClient::Request AXDaemonClient::request(const char* type) const {
  return Request{
      {AXProtocol::kRequest, Value::string(type)},
      {AXProtocol::kVersion, Value::unsignedInteger(static_cast<std::uint64_t>(protocolVersion()))},
  };
}

AXDaemonClient::Request AXDaemonClient::request(const char* type,
                                                const std::vector<std::string>& paths) const {
  Request r = request(type);
  r[AXProtocol::kPaths] = pathsValue(paths);
  return r;
}

AXDaemonClient::Request AXDaemonClient::request(const char* type,
                                                const std::vector<value::Uuid>& uuids,
                                                std::uint64_t flags) const {
  Request r = request(type);
  r[AXProtocol::kFlags] = Value::unsignedInteger(flags);
  set(r, uuids);
  return r;
}

void AXDaemonClient::set(Request& request, const std::vector<value::Uuid>& uuids) {
  value::Array array;
  array.reserve(uuids.size());
  for (const auto& uuid : uuids) array.push_back(Value::uuid(uuid));
  request[AXProtocol::kUuids] = Value::array(std::move(array));
}

void AXDaemonClient::send(Request request, ReplyHandler reply) {
  axd_->sendWithReply(Value::dictionary(value::Dictionary(std::move(request))), std::move(reply));
}

void AXDaemonClient::addPlugIns(const std::vector<std::string>& paths, ReplyHandler reply) {
  send(request(AXProtocol::kAdd, paths), std::move(reply));
}

void AXDaemonClient::removePlugIns(const std::vector<std::string>& paths, ReplyHandler reply) {
  send(request(AXProtocol::kRemove, paths), std::move(reply));
}

void AXDaemonClient::bulkPlugins(std::uint64_t flags, ReplyHandler reply) {
  Request r = request(AXProtocol::kBulk);
  r[AXProtocol::kFlags] = Value::unsignedInteger(flags);
  send(std::move(r), std::move(reply));
}

void AXDaemonClient::readyPlugIns(const std::vector<value::Uuid>& uuids, std::uint64_t flags,
                                  ReplyHandler reply) {
  send(request(AXProtocol::kReady, uuids, flags), std::move(reply));
}

void AXDaemonClient::accessPlugIns(const std::vector<value::Uuid>& uuids, std::uint64_t flags,
                                   ReplyHandler reply) {
  send(request(AXProtocol::kAccess, uuids, flags), std::move(reply));
}

void AXDaemonClient::matchPlugIns(const std::optional<value::Dictionary>& rule, std::uint64_t flags,
                                  ReplyHandler reply) {
  Request r = request(AXProtocol::kMatch);
  if (rule) r[AXProtocol::kRules] = value::PlistBridge::toMessage(Value::dictionary(*rule));
  r[AXProtocol::kFlags] = Value::unsignedInteger(flags);
  send(std::move(r), std::move(reply));
}

void AXDaemonClient::setPluginAnnotations(const std::vector<value::Uuid>& uuids,
                                          const value::Dictionary& annotations,
                                          ReplyHandler reply) {
  Request r = request(AXProtocol::kAnnotate);
  set(r, uuids);
  r[AXProtocol::kAnnotations] = value::PlistBridge::toMessage(Value::dictionary(annotations));
  send(std::move(r), std::move(reply));
}

void AXDaemonClient::holdPlugins(const std::vector<std::string>& paths, std::uint64_t flags,
                                 ReplyHandler reply) {
  Request r = request(AXProtocol::kLock, paths);
  r[AXProtocol::kFlags] = Value::unsignedInteger(flags);
  send(std::move(r), std::move(reply));
}

void AXDaemonClient::releaseHold(const value::Uuid& token, ReplyHandler reply) {
  Request r = request(AXProtocol::kLock);
  set(r, {token});
  send(std::move(r), std::move(reply));
}

std::optional<AXError> AXDaemonClient::errorInReply(const zyn::ReplyOrError& reply) {
  if (const auto* failure = std::get_if<zyn::ServiceError>(&reply)) {
    return AXMakeError(AXProtocol::kMalformedRequest, failure->description);
  }
  const value::Dictionary* fields = std::get<Value>(reply).asDictionary();
  const Value* codeValue = fields ? fields->find(AXProtocol::kErrorCode) : nullptr;
  const Value* errorValue = fields ? fields->find(AXProtocol::kError) : nullptr;
  auto code = static_cast<std::uint64_t>(codeValue ? codeValue->integerValue().value_or(0) : 0);
  const std::string* error = errorValue ? errorValue->asString() : nullptr;
  if (code == 0) {
    if (!error) return std::nullopt;
    throw AXInternalInconsistency("axd reported error without a code: " + *error);
  }
  return AXMakeError(static_cast<std::int64_t>(code),
                     error ? *error : "unknown error returned by Annexa subsystem");
}

std::optional<Value> AXDaemonClient::convertToZyn(const Value& plist, std::uint64_t version) {
  if (version != AXProtocol::kCurrentVersion) return std::nullopt;
  return Value::envelope(plist);
}

std::optional<Value> AXDaemonClient::convertFromZyn(const Value& envelope) const {
  if (protocolVersion() != static_cast<std::int64_t>(AXProtocol::kCurrentVersion)) {
    return std::nullopt;
  }
  const Value* carried = envelope.asEnvelope();
  if (!carried) return std::nullopt;
  return *carried;
}
