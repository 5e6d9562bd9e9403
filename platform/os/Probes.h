#pragma once

// The daemon's trace probes: one macro per probe of provider "axd" (axd_probes.d). With
// systemtap's sys/sdt.h a probe is a single no-op instruction plus an ELF note until a tracer
// attaches; without it every macro compiles to nothing and evaluates none of its arguments.
// Text arguments are UTF-8 and need only live during the firing.
//
// request-input and request-output are guarded: build their text only inside
//   if (AXD_PROBE_REQUEST_INPUT_ENABLED()) { ... AXD_PROBE_REQUEST_INPUT(pid, text.c_str()); }
// The _ENABLED() macros read the probe's semaphore, which a tracer raises while attached.

#if defined(AXD_HAVE_SDT)

#include <cstdint>

#include "platform/os/axd_probes.h"

// The casts fix each argument's size and signedness to the provider's declaration, so a tracer
// reads the same types whatever the caller passes.
#define AXD_PROBE_CLIENT_NEW(pid) AXD_CLIENT_NEW(static_cast<int>(pid))
#define AXD_PROBE_CLIENT_DONE(pid) AXD_CLIENT_DONE(static_cast<int>(pid))
#define AXD_PROBE_REQUEST_INPUT_ENABLED() (AXD_REQUEST_INPUT_ENABLED() != 0)
#define AXD_PROBE_REQUEST_INPUT(pid, text) \
  AXD_REQUEST_INPUT(static_cast<int>(pid), static_cast<const char*>(text))
#define AXD_PROBE_REQUEST(pid, type) \
  AXD_REQUEST(static_cast<int>(pid), static_cast<const char*>(type))
#define AXD_PROBE_REQUEST_OUTPUT_ENABLED() (AXD_REQUEST_OUTPUT_ENABLED() != 0)
#define AXD_PROBE_REQUEST_OUTPUT(pid, text) \
  AXD_REQUEST_OUTPUT(static_cast<int>(pid), static_cast<const char*>(text))
#define AXD_PROBE_DISCOVER_RAW(count) AXD_DISCOVER_RAW(static_cast<unsigned int>(count))
#define AXD_PROBE_PLUGIN_ADD(path) AXD_PLUGIN_ADD(static_cast<const char*>(path))
#define AXD_PROBE_PLUGIN_REMOVE(path, resolved) \
  AXD_PLUGIN_REMOVE(static_cast<const char*>(path), static_cast<bool>(resolved))
#define AXD_PROBE_PLUGIN_READY(uuid) AXD_PLUGIN_READY(static_cast<const char*>(uuid))
#define AXD_PROBE_DB_LOAD(domain, code) \
  AXD_DB_LOAD(static_cast<const char*>(domain), static_cast<std::uint64_t>(code))

#else

// sizeof names each argument without evaluating it, so no variable goes unused.
#define AXD_PROBE_CLIENT_NEW(pid) ((void)sizeof(pid))
#define AXD_PROBE_CLIENT_DONE(pid) ((void)sizeof(pid))
#define AXD_PROBE_REQUEST_INPUT_ENABLED() false
#define AXD_PROBE_REQUEST_INPUT(pid, text) ((void)sizeof(pid), (void)sizeof(text))
#define AXD_PROBE_REQUEST(pid, type) ((void)sizeof(pid), (void)sizeof(type))
#define AXD_PROBE_REQUEST_OUTPUT_ENABLED() false
#define AXD_PROBE_REQUEST_OUTPUT(pid, text) ((void)sizeof(pid), (void)sizeof(text))
#define AXD_PROBE_DISCOVER_RAW(count) ((void)sizeof(count))
#define AXD_PROBE_PLUGIN_ADD(path) ((void)sizeof(path))
#define AXD_PROBE_PLUGIN_REMOVE(path, resolved) ((void)sizeof(path), (void)sizeof(resolved))
#define AXD_PROBE_PLUGIN_READY(uuid) ((void)sizeof(uuid))
#define AXD_PROBE_DB_LOAD(domain, code) ((void)sizeof(domain), (void)sizeof(code))

#endif
