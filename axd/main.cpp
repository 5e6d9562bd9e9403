// axd: the Annexa plug-in daemon.

#include <signal.h>
#include <unistd.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>

#include "Annexa/AXDaemonClient.h"
#include "axd/AXDServer.h"
#include "platform/os/Log.h"

namespace {

[[noreturn]] void usage() {
  std::fputs("Usage: axd [-S servicename] [-v]\n", stderr);
  std::exit(2);
}

}  // namespace

int main(int argc, char** argv) {
  std::uint32_t verbose = 0;
  const char* databasePath = nullptr;
  int cacheLimit = 1000000;
  std::string serviceName = AXDaemonClient::defaultServiceName();

  opterr = 0;
  for (int option; (option = getopt(argc, argv, "c:d:S:v")) != -1;) {
    switch (option) {
      case 'c':
        // Plain conversion, like atoi: no range or syntax check; a negative limit wraps around.
        cacheLimit = static_cast<int>(std::strtol(optarg, nullptr, 10));
        break;
      case 'd':
        databasePath = optarg;
        break;
      case 'S':
        serviceName = optarg;
        break;
      case 'v':
        ++verbose;
        break;
      default:
        usage();
    }
  }
  if (optind < argc) usage();

  // A file-size limit must fail a save with EFBIG, which keeps the old file, not end the daemon.
  signal(SIGXFSZ, SIG_IGN);
  auto server = AXDServer::initForService(serviceName.c_str(), databasePath);
  if (!server) {
    os::Log::write(3, "unable to construct server");
    return 1;
  }
  server->setVerbose(verbose);
  server->setCacheLimit(static_cast<std::uint32_t>(cacheLimit));
  server->run();
  return 1;
}
