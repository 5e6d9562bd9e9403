#pragma once

#include <string>
#include <vector>

// Runs a program to its end and collects what it wrote. The environment is this process's.
struct Program {
  int status = -1;  // exit status; -1 when it did not exit normally or could not start
  std::string out;
  std::string err;

  static Program run(const std::vector<std::string>& argv);
};
