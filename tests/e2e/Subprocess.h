#pragma once

#include <chrono>
#include <map>
#include <string>
#include <vector>

// Runs a program to its end for the end-to-end tests: chosen arguments, this process's
// environment with some variables replaced, standard output and error captured. Not
// thread-safe: it reads the environment.
class Subprocess {
 public:
  using Environment = std::map<std::string, std::string>;

  struct Outcome {
    // The exit status; -1 when the program could not start, was killed by a signal or ran past
    // kTimeout (and was killed then).
    int status = -1;
    std::string out;
    std::string err;
  };

  // Long enough for a loaded machine under sanitizers; only a hanging program reaches it.
  static constexpr std::chrono::seconds kTimeout{30};
  // The status when the kernel refused the seccomp filter that run() was to install.
  static constexpr int kNoSeccomp = 125;

  // Runs |program| with |arguments| (argv[0] is the program's path) and |overrides| set in its
  // environment, and waits for it at most kTimeout. With |underSeccomp| it runs as a sandboxed
  // host does: under a seccomp filter that allows every call.
  static Outcome run(const std::string& program, const std::vector<std::string>& arguments,
                     const Environment& overrides = {}, bool underSeccomp = false);
};
