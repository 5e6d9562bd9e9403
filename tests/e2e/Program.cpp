#include "tests/e2e/Program.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fstream>
#include <sstream>

namespace {

std::string slurp(const std::string& path) {
  std::ifstream file(path);
  std::stringstream text;
  text << file.rdbuf();
  return text.str();
}

}  // namespace

Program Program::run(const std::vector<std::string>& argv) {
  char pattern[] = "/tmp/axd-program-XXXXXX";
  std::string dir = mkdtemp(pattern) ? pattern : "/tmp";
  std::string out = dir + "/out";
  std::string err = dir + "/err";
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, out.c_str(), O_WRONLY | O_CREAT, 0600);
  posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, err.c_str(), O_WRONLY | O_CREAT, 0600);
  std::vector<char*> words;
  for (const auto& word : argv) words.push_back(const_cast<char*>(word.c_str()));
  words.push_back(nullptr);
  Program result;
  pid_t pid = 0;
  if (posix_spawn(&pid, words[0], &actions, nullptr, words.data(), environ) == 0) {
    int status = 0;
    waitpid(pid, &status, 0);
    if (WIFEXITED(status)) result.status = WEXITSTATUS(status);
  }
  posix_spawn_file_actions_destroy(&actions);
  result.out = slurp(out);
  result.err = slurp(err);
  unlink(out.c_str());
  unlink(err.c_str());
  rmdir(dir.c_str());
  return result;
}
