// Loads any bytes as the user's annotation file through AXDAnnotationStore, as the daemon does
// at start-up, then saves what it kept to a second file, loads that and saves it to a third:
// what a store accepts it can save, every entry is a dictionary, and a saved file loads and saves
// again to the same bytes. (Not to the same table: XML keeps dates to the second, so a binary
// file's sub-second date comes back rounded.)
// Seeds: fuzz/corpus/annotations/.

#include <unistd.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

#include "axd/AXDAnnotationStore.h"
#include "platform/value/Value.h"

namespace {

// A private directory for the files, in memory where the system has /dev/shm, removed when the
// process exits.
const std::string& directory() {
  static const std::string made = [] {
    std::string base = std::filesystem::is_directory("/dev/shm") ? "/dev/shm" : "/tmp";
    std::string pattern = base + "/axd-annotation-fuzz.XXXXXX";
    if (!mkdtemp(pattern.data())) std::abort();
    return pattern;
  }();
  static const bool removedAtExit = std::atexit([] {
                                      std::error_code ignored;
                                      std::filesystem::remove_all(made, ignored);
                                    }) == 0;
  static_cast<void>(removedAtExit);
  return made;
}

void writeFile(const std::string& path, const std::uint8_t* data, std::size_t size) {
  std::FILE* file = std::fopen(path.c_str(), "wb");
  if (!file) std::abort();
  if (size > 0 && std::fwrite(data, 1, size, file) != size) std::abort();
  std::fclose(file);
}

std::string contents(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  return std::string(std::istreambuf_iterator<char>(in), {});
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  std::string loaded = directory() + "/Annotations";
  std::string saved = directory() + "/Saved";
  std::string savedAgain = directory() + "/SavedAgain";
  writeFile(loaded, data, size);
  AXDAnnotationStore store(loaded.c_str());
  for (const auto& [key, annotation] : store.annotations()) {
    if (!annotation.asDictionary()) std::abort();
  }
  store.setAnnotationsURL(saved);
  if (!store.saveDb(nullptr)) std::abort();
  AXDAnnotationStore again(saved.c_str());
  again.setAnnotationsURL(savedAgain);
  if (!again.saveDb(nullptr) || contents(saved) != contents(savedAgain)) std::abort();
  std::filesystem::remove_all(directory());
  std::filesystem::create_directory(directory());
  return 0;
}
