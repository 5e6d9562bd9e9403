#include "tests/e2e/Subprocess.h"

#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
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
                                    const Environment& overrides,
                                    std::chrono::milliseconds timeout) {
  TempDirectory output;
  const std::string outPath = output / "out";
  const std::string errPath = output / "err";
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, outPath.c_str(),
                                   O_WRONLY | O_CREAT | O_TRUNC, 0600);
  posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, errPath.c_str(),
                                   O_WRONLY | O_CREAT | O_TRUNC, 0600);
  std::vector<std::string> words{program};
  words.insert(words.end(), arguments.begin(), arguments.end());
  std::vector<std::string> settings = environmentWith(overrides);
  std::vector<char*> argv = pointersTo(words);
  std::vector<char*> envp = pointersTo(settings);
  pid_t pid = 0;
  int failed = posix_spawn(&pid, program.c_str(), &actions, nullptr, argv.data(), envp.data());
  posix_spawn_file_actions_destroy(&actions);
  Outcome outcome;
  if (failed != 0) {
    outcome.err = "cannot start " + program + ": " + std::strerror(failed);
    return outcome;
  }
  outcome.status = waitForExit(pid, timeout);
  outcome.out = contentsOf(outPath);
  outcome.err = contentsOf(errPath);
  return outcome;
}
