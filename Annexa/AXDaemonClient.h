#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "Annexa/AXError.h"
#include "platform/value/Value.h"
#include "platform/zyn/Connection.h"
#include "platform/zyn/StrandQueue.h"

// The client side of the daemon's protocol: builds each request, sends it with a reply expected
// and hands the raw reply to the caller's handler. Requests may be sent from any thread; all reply
// handlers of one client run one at a time, in arrival order, on its "axd_client" queue.
//
// Each client has an I/O thread of its own, which reads its replies and runs their handlers
// itself, so a reply costs no further thread hand-off. Clients therefore never wait for one
// another: a handler may block, or wait for the reply of another client, and only its own
// client's later replies wait meanwhile. A handler must not wait for a reply of its own client:
// that reply is read by the very thread the handler holds, so the wait never ends (a handler can
// tell with replyQueue()->isCurrent()). Destroying a client from one of its own handlers is fine.
//
// The connection is made once and never replaced: after it breaks, every request's handler gets
// the message service's error, which errorInReply() turns into code 4. A request whose frame
// would be over the frame limit is not sent; its handler gets the message service's
// "request too large (N bytes, limit M)", also code 4, and the connection goes on.
class AXDaemonClient {
 public:
  using Request = std::map<std::string, value::Value>;
  using ReplyHandler = std::function<void(const zyn::ReplyOrError&)>;

  // Connects to |serviceName|, or to the daemon's default service when it is null.
  explicit AXDaemonClient(const char* serviceName = nullptr);
  // Tells the daemon that this client goes away, and closes the connection.
  ~AXDaemonClient();
  AXDaemonClient(const AXDaemonClient&) = delete;
  AXDaemonClient& operator=(const AXDaemonClient&) = delete;

  // The daemon's default service name: the vendor prefix followed by ".annexa.axd".
  static std::string defaultServiceName();

  // A new request of |type| holding "request" and "version".
  Request request(const char* type) const;
  Request request(const char* type, const std::vector<std::string>& paths) const;
  // A request of |type| with "flags" and "uuids".
  Request request(const char* type, const std::vector<value::Uuid>& uuids,
                  std::uint64_t flags) const;
  static void set(Request& request, const std::vector<value::Uuid>& uuids);
  void send(Request request, ReplyHandler reply);

  void addPlugIns(const std::vector<std::string>& paths, ReplyHandler reply);
  void removePlugIns(const std::vector<std::string>& paths, ReplyHandler reply);
  void bulkPlugins(std::uint64_t flags, ReplyHandler reply);
  void readyPlugIns(const std::vector<value::Uuid>& uuids, std::uint64_t flags, ReplyHandler reply);
  void accessPlugIns(const std::vector<value::Uuid>& uuids, std::uint64_t flags,
                     ReplyHandler reply);
  // |rule| is left out of the request when there is none.
  void matchPlugIns(const std::optional<value::Dictionary>& rule, std::uint64_t flags,
                    ReplyHandler reply);
  void setPluginAnnotations(const std::vector<value::Uuid>& uuids,
                            const value::Dictionary& annotations, ReplyHandler reply);
  void holdPlugins(const std::vector<std::string>& paths, std::uint64_t flags, ReplyHandler reply);
  void releaseHold(const value::Uuid& token, ReplyHandler reply);

  // The error a reply stands for, or nothing for a success. Throws AXInternalInconsistency for
  // a reply with an "error" but no "errorcode": the daemon broke the protocol.
  static std::optional<AXError> errorInReply(const zyn::ReplyOrError& reply);

  // The property-list envelope of |value| for protocol version 3; nothing for any other version.
  static std::optional<value::Value> convertToZyn(const value::Value& plist, std::uint64_t version);
  // The property-list value carried by |envelope| when this client speaks version 3; nothing
  // otherwise, or when |envelope| is no envelope.
  std::optional<value::Value> convertFromZyn(const value::Value& envelope) const;

  std::int64_t protocolVersion() const { return protocolVersion_.load(); }
  void setProtocolVersion(std::int64_t version) { protocolVersion_.store(version); }

  const std::shared_ptr<zyn::Connection>& axd() const { return axd_; }
  const std::shared_ptr<zyn::StrandQueue>& replyQueue() const { return replyQueue_; }

 private:
  std::shared_ptr<zyn::StrandQueue> replyQueue_;
  std::shared_ptr<zyn::Connection> axd_;
  std::atomic<std::int64_t> protocolVersion_;
};
