#pragma once

#include <sys/types.h>

#include "platform/os/Error.h"
#include "platform/value/Dictionary.h"

// The host's side of starting a plug-in: once the daemon has made a plug-in ready for this
// process, the service launcher starts it here, as a child of this process. Stateless; safe to
// call from any thread.
class AXPlugInLauncher {
 public:
  // Starts the plug-in whose discovered form is |form| and returns the child's pid; the caller
  // owns the child and reaps it. The service is named by the form's "identifier" and "version",
  // which every discovered form carries. Fails with EINVAL, and a message naming the missing
  // piece and the plug-in's "uuid", when either is missing, empty or not a string; with EPERM
  // when this process was not made
  // ready for the plug-in; else with the launcher's error (launcher::ServiceLauncher::start),
  // e.g. ENOENT when the executable has gone since.
  static os::Result<pid_t> launch(const value::Dictionary& form);
};
