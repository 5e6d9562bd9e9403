#include "tests/e2e/Subprocess.h"

#include <fcntl.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <fstream>
#include <sstream>
#include <thread>

#include "tests/platform/TempDirectory.h"

namespace {

constexpr auto kPollInterval = std::chrono::milliseconds(10);

// This process's environment with |overrides| replacing (or adding) their variables.
std::vector<std::string> environmentWith(const Subprocess::Environment& overrides) {
  std::vector<std::string> settings;
  for (char** variable = environ; *variable; ++variable) {
    const char* equals = std::strchr(*variable, '=');
    std::string name(*variable, equals ? equals - *variable : std::strlen(*variable));
    if (!overrides.count(name)) settings.emplace_back(*variable);
  }
  for (const auto& [name, value] : overrides) settings.push_back(name + "=" + value);
  return settings;
}

std::vector<char*> pointersTo(std::vector<std::string>& words) {
  std::vector<char*> pointers;
  for (auto& word : words) pointers.push_back(word.data());
  pointers.push_back(nullptr);
  return pointers;
}

std::string contentsOf(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  std::stringstream text;
  text << file.rdbuf();
  return text.str();
}

// The exit status of |pid| once it ended; -1 when it was killed or ran past |timeout|.
int waitForExit(pid_t pid, std::chrono::milliseconds timeout) {
  const auto deadline = std::chrono::steady_clock::now() + timeout;
  int status = 0;
  while (waitpid(pid, &status, WNOHANG) != pid) {
    if (std::chrono::steady_clock::now() >= deadline) {
      kill(pid, SIGKILL);
      waitpid(pid, &status, 0);
      return -1;
    }
    std::this_thread::sleep_for(kPollInterval);
  }
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

}  // namespace

Subprocess::Outcome Subprocess::run(const std::string& program,
                                    const std::vector<std::string>& arguments,
                                    const Environment& overrides, bool underSeccomp) {
  TempDirectory output;
  const std::string outPath = output / "out";
  const std::string errPath = output / "err";
  std::vector<std::string> words{program};
  words.insert(words.end(), arguments.begin(), arguments.end());
  std::vector<std::string> settings = environmentWith(overrides);
  std::vector<char*> argv = pointersTo(words);
  std::vector<char*> envp = pointersTo(settings);
  sock_filter allow = BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW);
  sock_fprog filter{1, &allow};
  pid_t pid = fork();
  if (pid == 0) {
    // Only async-signal-safe calls between fork and exec: the parent has threads. No_new_privs
    // keeps the filter across exec.
    dup2(open(outPath.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600), STDOUT_FILENO);
    dup2(open(errPath.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600), STDERR_FILENO);
    if (underSeccomp && (prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0 ||
                         prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &filter) != 0)) {
      _exit(kNoSeccomp);
    }
    execve(program.c_str(), argv.data(), envp.data());
    _exit(127);
  }
  Outcome outcome;
  if (pid < 0) return outcome;
  outcome.status = waitForExit(pid, kTimeout);
  outcome.out = contentsOf(outPath);
  outcome.err = contentsOf(errPath);
  return outcome;
}
