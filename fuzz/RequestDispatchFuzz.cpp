// Serves any request through the daemon's whole request path, in process: the input is the CBOR
// body of one request frame, sent by a real client connection to a server on a device root of
// its own with two plug-ins registered. Whatever the body asks, a body that the daemon's frame
// decoder takes as a dictionary is answered with exactly one reply and the connection stays.
// The registered plug-ins' UUIDs are random, so in "uuids" the stand-ins
// 00000000-0000-0000-0000-000000000001 and ...0002 name them. Seeds: fuzz/corpus/dispatch/.

#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "Annexa/AXProtocol.h"
#include "axd/AXDServer.h"
#include "platform/os/Paths.h"
#include "platform/registrum/Workspace.h"
#include "platform/zyn/Frame.h"
#include "tests/e2e/Bundles.h"
#include "tests/e2e/RawClient.h"

namespace {

constexpr const char* kServiceName = "axd.fuzz";

// A fresh device root, in memory where the system has /dev/shm, made this process's and removed
// when it exits.
void makeRoot() {
  static std::string root = (std::filesystem::is_directory("/dev/shm") ? "/dev/shm" : "/tmp") +
                            std::string("/axd-dispatch-fuzz.XXXXXX");
  if (!mkdtemp(root.data())) std::abort();
  setenv("ANNEXA_ROOT", root.c_str(), 1);
  std::atexit([] {
    std::error_code ignored;
    std::filesystem::remove_all(root, ignored);
  });
}

// The registered plug-ins' UUIDs, in the order of their stand-ins.
std::vector<value::Uuid> registered;

// Registers two plug-ins of one application, so that requests find records to work on.
void registerPlugIns(RawClient& client) {
  std::string applications = std::string(std::getenv("ANNEXA_ROOT")) + "/Applications";
  value::Array paths;
  for (const char* id : {"fuzz.one", "fuzz.two"}) {
    paths.push_back(value::Value::string(
        bundles::plugIn(applications, "Host", {.id = id, .executable = "/bin/true"})));
  }
  value::Dictionary add{
      {AXProtocol::kRequest, value::Value::string(AXProtocol::kAdd)},
      {AXProtocol::kVersion, value::Value::unsignedInteger(AXProtocol::kCurrentVersion)},
      {AXProtocol::kPaths, value::Value::array(paths)}};
  if (client.request(1, value::Value::dictionary(std::move(add))) != "ok") std::abort();
  auto workspace = registrum::Workspace::defaultWorkspace();
  if (!workspace.ok()) std::abort();
  for (const value::Value& path : paths) {
    auto record = workspace.value()->plugInAtPath(*path.asString());
    if (!record.ok() || !record.value()) std::abort();
    registered.push_back(record.value()->uuid());
  }
}

// |request| with each stand-in in "uuids" replaced by the UUID it stands for.
value::Value withRegisteredUuids(const value::Dictionary& request) {
  const value::Value* uuids = request.find(AXProtocol::kUuids);
  const value::Array* list = uuids ? uuids->asArray() : nullptr;
  if (!list) return value::Value::dictionary(request);
  value::Array replaced;
  for (const value::Value& element : *list) {
    const value::Uuid* uuid = element.asUuid();
    std::size_t index = uuid ? uuid->bytes()[15] : 0;
    bool standIn = uuid && index >= 1 && index <= registered.size() &&
                   std::all_of(uuid->bytes().begin(), uuid->bytes().end() - 1,
                               [](std::uint8_t byte) { return byte == 0; });
    replaced.push_back(standIn ? value::Value::uuid(registered[index - 1]) : element);
  }
  return value::Value::dictionary(
      request.with(AXProtocol::kUuids, value::Value::array(std::move(replaced))));
}

RawClient& client() {
  static RawClient* connected = [] {
    makeRoot();
    std::shared_ptr<AXDServer> server = AXDServer::initForService(kServiceName, nullptr);
    if (!server) std::abort();
    server->service()->resume();
    auto made = RawClient::connect(os::Paths::zynSocketDir() + "/" + kServiceName);
    if (!made.ok()) std::abort();
    RawClient* client = made.value().release();
    registerPlugIns(*client);
    return client;
  }();
  return *connected;
}

// The request |body| holds, when the daemon's decoder takes it as a dictionary.
std::optional<value::Dictionary> requestIn(std::span<const std::uint8_t> body) {
  std::vector<std::uint8_t> frame;
  if (!zyn::encodeFrame(zyn::Frame{zyn::FrameKind::Request, 1, value::Value()}, frame)) {
    return std::nullopt;
  }
  frame.resize(frame.size() - 1);  // The null item, replaced by |body|.
  frame.insert(frame.end(), body.begin(), body.end());
  std::uint32_t length = static_cast<std::uint32_t>(frame.size() - 4);
  for (int i = 0; i < 4; ++i) frame[i] = static_cast<std::uint8_t>(length >> (24 - 8 * i));
  zyn::FrameDecoder decoder;
  std::uint8_t* space = decoder.prepare(frame.size());
  std::copy(frame.begin(), frame.end(), space);
  decoder.commit(frame.size());
  auto decoded = decoder.next();
  if (!decoded.ok() || !decoded.value() || !decoded.value()->body.asDictionary()) {
    return std::nullopt;
  }
  return *decoded.value()->body.asDictionary();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static std::uint64_t id = 1;
  RawClient& connection = client();
  std::optional<value::Dictionary> request = requestIn(std::span(data, size));
  if (!request) return 0;
  if (connection.request(++id, withRegisteredUuids(*request)) == "no reply") std::abort();
  return 0;
}
