#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "Annexa/AXError.h"
#include "axd/AXDPlugIn.h"
#include "platform/value/Value.h"
#include "platform/zyn/Message.h"
#include "platform/zyn/Reply.h"

class AXDMatchList;
class AXDPlugInHold;
class AXDServer;
class AXDZynClient;
namespace zyn {
class Connection;
}

// One request being served, from its arrival to the one reply that ends it. Made on the client's
// connection delivery, then dispatched once on the service queue, where it checks the protocol
// version, picks the handler by request type, and ends with exactly one done() or fail()
// (or, for a client that died, no reply at all). Owned by the work item that runs it.
class Transaction {
 public:
  Transaction(const zyn::Message& request, std::shared_ptr<AXDZynClient> client);

  // Serves the request. Called once, on the service queue.
  void dispatch();

  // Sends the reply with the fields set so far (dropped when the connection is gone). A reply
  // over the frame limit is logged and replaced by a failure with code 4 and the message
  // "reply too large (N bytes, limit M)"; the connection goes on.
  void done();
  // Sets "errorcode" (and "error" when there is a message), then done().
  void fail(std::int64_t code, const std::optional<std::string>& message);
  // An Annexa error replies with its own code and message; an error of another domain with
  // |code| and its message.
  void fail(std::int64_t code, const AXError& error);

  const std::shared_ptr<AXDZynClient>& client() const { return client_; }
  const value::Dictionary& request() const { return request_; }
  zyn::Reply& reply() { return reply_; }
  std::uint64_t version() const { return version_; }
  const std::shared_ptr<AXDServer>& server() const;
  std::shared_ptr<zyn::Connection> connection() const;

  // Request handlers: each ends the transaction with exactly one reply.
  void addPlugIns();
  void removePlugIns();
  void bulkPlugIns();
  void annotatePlugIns();
  void matchPlugIns();
  void readyPlugIns();
  void accessPlugIns();
  void lockDownPlugIns();

  // Called per path with the path and whether it could be resolved (the resolved path when it
  // could, the path as given when not). Returns false to stop, having sent the failure reply.
  using PathVisitor = std::function<bool(const std::string& path, bool resolved)>;
  // Called per plug-in; returns false to stop, having sent the failure reply.
  using PlugInVisitor = std::function<bool(const std::shared_ptr<AXDPlugIn>& plugIn)>;

  // Walks "paths" in order. True when every path was accepted and visited with true; on a
  // failure it detects itself it sends the failure reply. Sends nothing on success.
  bool marshalPaths(const PathVisitor& visitor);
  // marshalPaths(), then done() when it returned true.
  bool processPaths(const PathVisitor& visitor);
  // Walks "uuids" in order, looking each plug-in up. True when every element named a known
  // plug-in and was visited with true; otherwise the failure reply has been sent. The caller
  // sends the success reply.
  bool processUuidList(const PlugInVisitor& visitor);

 private:
  // What one discovery request asks, read once at its start.
  struct Discovery {
    std::optional<value::Dictionary> rule;
    std::uint64_t flags = 0;
    bool all = false;
    std::optional<value::Value> exclusions;
    // The user's annotations by annotation key when the discovery began.
    value::Dictionary annotations;
    // The active holds when the discovery began.
    std::vector<std::shared_ptr<AXDPlugInHold>> holds;
    // The boot key that signs the forms' read extensions, read once for the whole discovery;
    // nothing (logged) when it cannot be read, and the forms then carry no tokens.
    AXDPlugIn::SealingKey key;
  };

  // The boot key for this discovery's tokens; nothing, logged, when it cannot be read.
  AXDPlugIn::SealingKey bootKey();
  // True when the client may discover with AXDiscoverAll: it has the manager entitlement and,
  // asked only then, runs outside any sandbox (a sandbox that cannot be asked counts as one).
  bool mayDiscoverAll();
  // The candidate steps for one record of a discovery: appended to |matches| when kept.
  void considerCandidate(const AXDPlugIn& plugIn, const Discovery& discovery,
                         AXDMatchList& matches);
  // True when |discovery| hides |plugIn| from this client: off the system volume outside an
  // application or with flag 0x8, dedicated to another application, or held.
  bool hiddenFromClient(const AXDPlugIn& plugIn, const Discovery& discovery);
  // True (logged at debug level) when |plugIn| matches one of the user's exclusion rules.
  bool excluded(const AXDPlugIn& plugIn, const Discovery& discovery);

  // Why the client may not have |plugIn| made ready (logged at debug level), or nothing: a hold
  // ("the plug-in is on hold"), then, except for a data plug-in, the access policy.
  std::optional<std::string> readyRefusal(const AXDPlugIn& plugIn);
  // Hold mode of the lock request: the plug-ins |flags| name at each path, or nothing when a
  // path fails (the failure sent). |paths| receives the canonical path of each bundle held.
  std::optional<std::vector<std::shared_ptr<AXDPlugIn>>> plugInsToHold(
      std::uint64_t flags, std::vector<std::string>& paths);

  // An integer field of the request; 0 when absent or not an unsigned integer.
  std::uint64_t integerField(const char* key) const;
  // Visits the elements of the array |key| in order until |visit| returns false. Fails with
  // code 4 and |invalid| when |key| is absent or not an array, and with code 4 when it holds more
  // than AXProtocol::kMaxListLength elements (nothing visited).
  bool walkArray(const char* key, const char* invalid,
                 const std::function<bool(const value::Value&)>& visit);
  // One element of "paths": false (failure sent) when it is not an absolute path string.
  bool visitPath(const value::Value& element, const PathVisitor& visitor);
  // One element of "uuids": false (failure sent) when it names no plug-in.
  bool visitUuid(const value::Value& element, const PlugInVisitor& visitor);

  const std::shared_ptr<AXDZynClient> client_;
  const value::Dictionary request_;
  zyn::Reply reply_;
  std::uint64_t version_ = 0;
};
