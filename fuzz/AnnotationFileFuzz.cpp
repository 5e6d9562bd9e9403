// Loads any bytes as the user's annotation file through AXDAnnotationStore, as the daemon does
// at start-up, then saves what it kept to a second file and loads that again: what a store
// accepts it can save, and a saved file loads back to the same table, every entry a dictionary.
// Seeds: fuzz/corpus/annotations/.

#include <unistd.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <string>

#include "FuzzInput.h"
#include "axd/AXDAnnotationStore.h"

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

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  std::string loaded = directory() + "/Annotations";
  std::string saved = directory() + "/Saved";
  writeFile(loaded, data, size);
  AXDAnnotationStore store(loaded.c_str());
  for (const auto& [key, annotation] : store.annotations()) {
    if (!annotation.asDictionary()) std::abort();
  }
  store.setAnnotationsURL(saved);
  if (!store.saveDb(nullptr)) std::abort();
  AXDAnnotationStore again(saved.c_str());
  if (!fuzz::sameValue(value::Value::dictionary(again.annotations()),
                       value::Value::dictionary(store.annotations()))) {
    std::abort();
  }
  std::filesystem::remove_all(directory());
  std::filesystem::create_directory(directory());
  return 0;
}
