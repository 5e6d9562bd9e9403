#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <initializer_list>
#include <memory>
#include <string_view>

#include "axd/AXDatabase.h"
#include "platform/os/Format.h"
#include "platform/zyn/Listener.h"
#include "platform/zyn/StrandQueue.h"
#include "platform/zyn/SyncQueue.h"
#include "platform/zyn/ThreadQueue.h"

// The daemon's one service object: the plug-in database, the listener on the named service, and
// the queues that order the daemon's work. New connections arrive on "zyn"; every request is
// worked on "service", one at a time; "serverSync" guards the holds. Exactly one exists per
// process; it lives until the process ends. log() and debug() may be called from any thread.
class AXDServer : public AXDatabase, public std::enable_shared_from_this<AXDServer> {
 public:
  // Builds the server for |serviceName| with the annotation file |databasePath| (null for the
  // default). Nothing when the database or the listener cannot be set up (logged). The listener
  // is not resumed: no client is accepted before run().
  static std::shared_ptr<AXDServer> initForService(const char* serviceName,
                                                   const char* databasePath);

  // Accepts clients and keeps the process alive; does not return.
  void run();

  // The shared server: the one built by initForService(), never cleared.
  static std::shared_ptr<AXDServer> server();

  // Writes the formatted message to the system log; the level does not change the output.
  void log(int level, std::string_view format,
           std::initializer_list<os::FormatArg> arguments) const;
  // log() at level 5: always written.
  void log(std::string_view format, std::initializer_list<os::FormatArg> arguments) const;
  // log() at level 6, only when verbose() is at least 1.
  void debug(std::string_view format, std::initializer_list<os::FormatArg> arguments) const;

  // Schedules |work| on the service queue and returns at once.
  void submitWork(std::function<void()> work);

  std::uint32_t verbose() const { return verbose_.load(std::memory_order_relaxed); }
  void setVerbose(std::uint32_t verbose) { verbose_.store(verbose, std::memory_order_relaxed); }

  const std::shared_ptr<zyn::StrandQueue>& zynQueue() const { return zynQueue_; }
  const std::shared_ptr<zyn::ThreadQueue>& mainQueue() const { return mainQueue_; }
  const std::shared_ptr<zyn::Listener>& service() const { return service_; }
  zyn::SyncQueue& syncQueue() { return *syncQueue_; }

 private:
  AXDServer() = default;

  std::atomic<std::uint32_t> verbose_{0};
  std::shared_ptr<zyn::StrandQueue> zynQueue_;
  std::shared_ptr<zyn::ThreadQueue> mainQueue_;
  std::shared_ptr<zyn::Listener> service_;
  std::unique_ptr<zyn::SyncQueue> syncQueue_;
};
