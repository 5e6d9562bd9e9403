#pragma once

#include <stdlib.h>

#include <filesystem>
#include <fstream>
#include <string>

// A fresh directory under /tmp, removed with everything in it when the object goes out of
// scope.
class TempDirectory {
 public:
  TempDirectory() {
    char pattern[] = "/tmp/axd-test-XXXXXX";
    const char* made = mkdtemp(pattern);
    path_ = made ? made : "";
  }
  TempDirectory(const TempDirectory&) = delete;
  TempDirectory& operator=(const TempDirectory&) = delete;

  ~TempDirectory() {
    std::error_code ignored;
    if (!path_.empty()) std::filesystem::remove_all(path_, ignored);
  }

  // Empty when mkdtemp failed.
  const std::string& path() const { return path_; }

  std::string operator/(const std::string& relative) const { return path_ + "/" + relative; }

  // Writes |contents| to |relative|, creating its directories, and returns the file's path.
  std::string write(const std::string& relative, const std::string& contents) const {
    std::string file = *this / relative;
    std::error_code ignored;
    std::filesystem::create_directories(std::filesystem::path(file).parent_path(), ignored);
    std::ofstream(file, std::ios::binary | std::ios::trunc) << contents;
    return file;
  }

 private:
  std::string path_;
};
