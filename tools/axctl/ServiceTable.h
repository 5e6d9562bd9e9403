#pragma once

// `axctl services`: prints the service launcher's table of this device root, which host process
// may start which plug-in. Does not talk to the daemon.
class ServiceTable {
 public:
  // Prints a header and one line per service (host pid, bundle identifier, version, sandbox
  // profile or "-", executable), sorted as the launcher lists them; with |json|, an array of the
  // whole entries instead. Returns the exit status: 0, or 1 when the table cannot be read (the
  // reason is printed on standard error). An empty table is a success.
  static int print(bool json);
};
