#include "platform/prefs/DomainFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <ctime>

#include "platform/os/AtomicFile.h"
#include "platform/os/Log.h"
#include "platform/value/PropertyList.h"
#include "platform/value/Value.h"

namespace prefs {

namespace {

constexpr int kLogWarning = 4;
constexpr std::int64_t kNanoseconds = 1'000'000'000;

std::int64_t nanoseconds(const timespec& time) {
  return static_cast<std::int64_t>(time.tv_sec) * kNanoseconds + time.tv_nsec;
}

std::int64_t now() {
  timespec time{};
  clock_gettime(CLOCK_REALTIME, &time);
  return nanoseconds(time);
}

}  // namespace

void DomainFile::synchronize() {
  std::int64_t readAt = now();
  Stamp stamp = stampOf(path_);
  if (stamp_ == stamp && settled_) return;
  bool changed = stamp_ != stamp;
  stamp_ = stamp;
  settled_ = stamp.error != 0 || stamp.changed + kSettleSeconds * kNanoseconds <= readAt;
  os::Result<value::Dictionary> read = DomainFile::read(path_);
  if (read.ok()) {
    contents_ = std::move(read).value();
    return;
  }
  contents_.reset();
  if (changed && read.error().errnum != ENOENT) {
    os::Log::write(kLogWarning, "preferences: ignoring " + read.error().message);
  }
}

os::Result<value::Dictionary> DomainFile::read(const std::string& path) {
  os::Result<value::Value> read = value::PropertyList::readFile(path);
  if (!read.ok()) return read.error();
  if (const value::Dictionary* contents = read.value().asDictionary()) return *contents;
  return os::Error{EINVAL, path + ": not a dictionary"};
}

os::Status DomainFile::write(const std::string& path, const value::Dictionary& contents) {
  os::Result<std::string> xml = value::PropertyList::toXml(value::Value::dictionary(contents));
  if (!xml.ok()) return xml.error();
  return os::AtomicFile::replace(path, xml.value(), os::AtomicFile::Durability::Durable);
}

DomainFile::Stamp DomainFile::stampOf(const std::string& path) {
  struct stat st {};
  if (stat(path.c_str(), &st) != 0) return Stamp{.error = errno};
  return Stamp{.device = st.st_dev,
               .inode = st.st_ino,
               .size = st.st_size,
               .modified = nanoseconds(st.st_mtim),
               .changed = nanoseconds(st.st_ctim)};
}

}  // namespace prefs
