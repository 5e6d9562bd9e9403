#pragma once

#include <sys/wait.h>
#include <unistd.h>

#include <functional>
#include <string>
#include <utility>
#include <vector>

// A forked child that runs |prepare| (which returns 0 or an error number), reports its result to
// the parent and then waits, alive, until the object is destroyed: so the parent can inspect a
// process in a state that |prepare| set up. The child never returns into the test program.
class PausedChild {
 public:
  explicit PausedChild(const std::function<int()>& prepare) {
    int report[2];
    int hold[2];
    if (pipe(report) != 0 || pipe(hold) != 0) return;
    pid_ = fork();
    if (pid_ == 0) {
      close(report[0]);
      close(hold[1]);
      int result = prepare();
      ssize_t ignored = write(report[1], &result, sizeof result);
      char byte;
      ignored = read(hold[0], &byte, 1);  // returns when the parent closes its end
      (void)ignored;
      _exit(0);
    }
    close(report[1]);
    close(hold[0]);
    release_ = hold[1];
    if (pid_ < 0 || read(report[0], &prepared_, sizeof prepared_) != sizeof prepared_) {
      prepared_ = -1;
    }
    close(report[0]);
  }
  PausedChild(const PausedChild&) = delete;
  PausedChild& operator=(const PausedChild&) = delete;

  ~PausedChild() {
    if (release_ >= 0) close(release_);
    if (pid_ > 0) waitpid(pid_, nullptr, 0);
  }

  pid_t pid() const { return pid_; }
  // What |prepare| returned; -1 when the child could not be started.
  int prepared() const { return prepared_; }

 private:
  pid_t pid_ = -1;
  int release_ = -1;
  int prepared_ = -1;
};

// Forks |count| children that start |body| together (all wait for one signal) and returns the
// text each produced, in fork order; "" for a child that failed.
inline std::vector<std::string> outputsOfChildren(int count,
                                                  const std::function<std::string()>& body) {
  int start[2];
  if (pipe(start) != 0) return std::vector<std::string>(count);
  std::vector<std::pair<pid_t, int>> children;
  for (int i = 0; i < count; ++i) {
    int out[2];
    if (pipe(out) != 0) break;
    pid_t pid = fork();
    if (pid == 0) {
      close(start[1]);
      close(out[0]);
      char byte;
      ssize_t ignored = read(start[0], &byte, 1);  // returns when the parent closes its end
      std::string text = body();
      ignored = write(out[1], text.data(), text.size());
      (void)ignored;
      _exit(0);
    }
    close(out[1]);
    children.emplace_back(pid, out[0]);
  }
  close(start[0]);
  close(start[1]);
  std::vector<std::string> outputs;
  for (auto [pid, fd] : children) {
    std::string text;
    char buffer[512];
    ssize_t n;
    while ((n = read(fd, buffer, sizeof buffer)) > 0) text.append(buffer, n);
    close(fd);
    int status = 0;
    bool exited = pid > 0 && waitpid(pid, &status, 0) == pid && WIFEXITED(status);
    outputs.push_back(exited ? text : "");
  }
  outputs.resize(count);
  return outputs;
}
