// Reads arbitrary bytes as a launcher service file with launcher::ServiceFile::read (through a
// memory file, since it reads a path). Contents it accepts encode to a file that reads back the
// same. Seeds: fuzz/corpus/service/.

#include <sys/mman.h>
#include <unistd.h>

#include <cstdint>
#include <cstdlib>
#include <string>

#include "FuzzInput.h"
#include "platform/launcher/ServiceFile.h"

namespace {

// The path of a memory file holding |data| alone; the file is reused from call to call.
std::string holding(const void* data, std::size_t size) {
  static const int fd = memfd_create("service-file", MFD_CLOEXEC);
  if (fd < 0 || ftruncate(fd, 0) != 0) std::abort();
  if (size > 0 && pwrite(fd, data, size, 0) != static_cast<ssize_t>(size)) std::abort();
  return "/proc/self/fd/" + std::to_string(fd);
}

bool same(const launcher::ServiceFile::Contents& a, const launcher::ServiceFile::Contents& b) {
  return a.executablePath == b.executablePath &&
         fuzz::sameValue(value::Value::dictionary(a.description),
                         value::Value::dictionary(b.description)) &&
         a.hostStartTime == b.hostStartTime;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  auto contents = launcher::ServiceFile::read(holding(data, size));
  if (!contents.ok()) return 0;
  auto text = launcher::ServiceFile::encode(contents.value());
  if (!text.ok()) return 0;
  auto again = launcher::ServiceFile::read(holding(text.value().data(), text.value().size()));
  if (!again.ok() || !same(again.value(), contents.value())) std::abort();
  return 0;
}
