#include "platform/launcher/CleanSpawn.h"

#include <signal.h>
#include <spawn.h>

#include <cstring>

namespace launcher {

namespace {

struct Attributes {
  Attributes() : made(posix_spawnattr_init(&value)) {}
  ~Attributes() {
    if (made == 0) posix_spawnattr_destroy(&value);
  }
  posix_spawnattr_t value;
  int made;
};

struct FileActions {
  FileActions() : made(posix_spawn_file_actions_init(&value)) {}
  ~FileActions() {
    if (made == 0) posix_spawn_file_actions_destroy(&value);
  }
  posix_spawn_file_actions_t value;
  int made;
};

os::Error spawnError(int errnum, const std::string& what) {
  return os::Error{errnum, "launcher: " + what + ": " + std::strerror(errnum)};
}

// Signal dispositions and the mask are inherited across exec, descriptors without
// close-on-exec too; the child gets none of ours but |executableFd|, as kExecutableDescriptor.
int configure(Attributes& attributes, FileActions& actions, int executableFd) {
  sigset_t none, all;
  sigemptyset(&none);
  sigfillset(&all);
  int failed = attributes.made ? attributes.made : actions.made;
  if (failed == 0) failed = posix_spawnattr_setsigmask(&attributes.value, &none);
  if (failed == 0) failed = posix_spawnattr_setsigdefault(&attributes.value, &all);
  if (failed == 0) {
    failed =
        posix_spawnattr_setflags(&attributes.value, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF);
  }
  if (failed != 0) return failed;
  if (executableFd < 0) return posix_spawn_file_actions_addclosefrom_np(&actions.value, 3);
  // The copy dup2 makes has no close-on-exec; everything above it is closed.
  failed = posix_spawn_file_actions_adddup2(&actions.value, executableFd,
                                            CleanSpawn::kExecutableDescriptor);
  if (failed == 0) {
    failed = posix_spawn_file_actions_addclosefrom_np(&actions.value,
                                                      CleanSpawn::kExecutableDescriptor + 1);
  }
  return failed;
}

os::Result<pid_t> spawn(const std::string& program, const std::string& path, int executableFd,
                        const std::vector<std::string>& environment) {
  Attributes attributes;
  FileActions actions;
  if (int failed = configure(attributes, actions, executableFd)) {
    return spawnError(failed, "spawn settings");
  }
  std::vector<char*> envp;
  for (const std::string& entry : environment) envp.push_back(const_cast<char*>(entry.c_str()));
  envp.push_back(nullptr);
  std::string argv0 = program;
  char* argv[] = {argv0.data(), nullptr};
  pid_t child = 0;
  int failed =
      posix_spawn(&child, path.c_str(), &actions.value, &attributes.value, argv, envp.data());
  if (failed != 0) return spawnError(failed, "spawning " + program);
  return child;
}

}  // namespace

os::Result<pid_t> CleanSpawn::run(const std::string& program,
                                  const std::vector<std::string>& environment) {
  return spawn(program, program, -1, environment);
}

os::Result<pid_t> CleanSpawn::runOpened(const std::string& program, int executableFd,
                                        const std::vector<std::string>& environment) {
  return spawn(program, "/proc/self/fd/" + std::to_string(kExecutableDescriptor), executableFd,
               environment);
}

}  // namespace launcher
