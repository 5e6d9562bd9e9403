#include "platform/os/Probes.h"

#if defined(AXD_HAVE_SDT)
#include "platform/os/axd_probes.h"
#else
// Without the tracing header every probe is nothing and no probe is ever enabled.
#define AXD_CLIENT_NEW(...)
#define AXD_CLIENT_DONE(...)
#define AXD_REQUEST_INPUT_ENABLED() 0
#define AXD_REQUEST_INPUT(...)
#define AXD_REQUEST(...)
#define AXD_REQUEST_OUTPUT_ENABLED() 0
#define AXD_REQUEST_OUTPUT(...)
#define AXD_DISCOVER_RAW(...)
#define AXD_PLUGIN_ADD(...)
#define AXD_PLUGIN_REMOVE(...)
#define AXD_PLUGIN_READY(...)
#define AXD_DB_LOAD(...)
#endif

namespace os {

void Probes::clientNew([[maybe_unused]] int pid) {
  AXD_CLIENT_NEW(pid);
}

void Probes::clientDone([[maybe_unused]] int pid) {
  AXD_CLIENT_DONE(pid);
}

bool Probes::requestInputEnabled() {
  return AXD_REQUEST_INPUT_ENABLED() != 0;
}

void Probes::requestInput([[maybe_unused]] int pid, [[maybe_unused]] const char* description) {
  AXD_REQUEST_INPUT(pid, description);
}

void Probes::request([[maybe_unused]] int pid, [[maybe_unused]] const char* type) {
  AXD_REQUEST(pid, type);
}

bool Probes::requestOutputEnabled() {
  return AXD_REQUEST_OUTPUT_ENABLED() != 0;
}

void Probes::requestOutput([[maybe_unused]] int pid, [[maybe_unused]] const char* description) {
  AXD_REQUEST_OUTPUT(pid, description);
}

void Probes::discoverRaw([[maybe_unused]] unsigned int count) {
  AXD_DISCOVER_RAW(count);
}

void Probes::pluginAdd([[maybe_unused]] const char* path) {
  AXD_PLUGIN_ADD(path);
}

void Probes::pluginRemove([[maybe_unused]] const char* path, [[maybe_unused]] bool resolved) {
  AXD_PLUGIN_REMOVE(path, resolved);
}

void Probes::pluginReady([[maybe_unused]] const char* uuid) {
  AXD_PLUGIN_READY(uuid);
}

void Probes::dbLoad([[maybe_unused]] const char* domain, [[maybe_unused]] std::uint64_t code) {
  AXD_DB_LOAD(domain, code);
}

}  // namespace os
