#pragma once

#include <cstdint>

namespace os {

// The daemon's trace probes, the ten of provider "axd" (axd_probes.d). With systemtap's
// sys/sdt.h each is a single no-op instruction plus an ELF note until a tracer attaches; without
// it they do nothing. All ten live in one object file, so a program that fires any of them
// carries all ten (`readelf -n` lists them). Text arguments are UTF-8 and need only live during
// the firing. Safe to call from any thread.
//
// request-input and request-output are guarded: build their text only inside
//   if (os::Probes::requestInputEnabled()) { ... os::Probes::requestInput(pid, text.c_str()); }
// The *Enabled() functions read the probe's semaphore, which a tracer raises while attached.
class Probes {
 public:
  static void clientNew(int pid);
  static void clientDone(int pid);
  static bool requestInputEnabled();
  static void requestInput(int pid, const char* description);
  static void request(int pid, const char* type);
  static bool requestOutputEnabled();
  static void requestOutput(int pid, const char* description);
  static void discoverRaw(unsigned int count);
  static void pluginAdd(const char* path);
  static void pluginRemove(const char* path, bool resolved);
  static void pluginReady(const char* uuid);
  static void dbLoad(const char* domain, std::uint64_t code);
};

}  // namespace os
