#pragma once

#include <stdio.h>
#include <stdlib.h>
#include <unistd.h>

#include <string>

// The log writes to standard error only when AXD_LOG is "stderr" at its first line, so the test
// program sets it before main runs.
inline const bool kLogToStandardError = [] {
  setenv("AXD_LOG", "stderr", 1);
  return true;
}();

// Redirects file descriptor 2 into a temporary file for its lifetime, so a test can read the
// log lines that the code under test wrote. Not thread-safe: one capture at a time.
class LogCapture {
 public:
  LogCapture() : file_(tmpfile()), saved_(dup(STDERR_FILENO)) {
    fflush(stderr);
    dup2(fileno(file_), STDERR_FILENO);
  }
  LogCapture(const LogCapture&) = delete;
  LogCapture& operator=(const LogCapture&) = delete;

  ~LogCapture() {
    dup2(saved_, STDERR_FILENO);
    close(saved_);
    fclose(file_);
  }

  // Everything written to standard error since the capture began.
  std::string text() const {
    std::string out;
    char buffer[4096];
    ssize_t n;
    off_t offset = 0;
    while ((n = pread(fileno(file_), buffer, sizeof buffer, offset)) > 0) {
      out.append(buffer, static_cast<std::size_t>(n));
      offset += n;
    }
    return out;
  }

 private:
  FILE* file_;
  int saved_;
};
