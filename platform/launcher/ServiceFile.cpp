#include "platform/launcher/ServiceFile.h"

#include <cerrno>

#include "platform/value/PropertyList.h"
#include "platform/value/Value.h"

namespace launcher {

namespace {

constexpr char kExecutable[] = "Executable";
constexpr char kDescription[] = "Description";
constexpr char kHostStartTime[] = "HostStartTime";

}  // namespace

os::Result<std::string> ServiceFile::encode(const Contents& contents) {
  return value::PropertyList::toXml(value::Value::dictionary(
      {{kExecutable, value::Value::string(contents.executablePath)},
       {kDescription, value::Value::dictionary(contents.description)},
       {kHostStartTime,
        value::Value::integer(static_cast<std::int64_t>(contents.hostStartTime))}}));
}

os::Result<ServiceFile::Contents> ServiceFile::read(const std::string& path) {
  os::Result<value::Value> read = value::PropertyList::readFile(path);
  if (!read.ok()) return read.error();
  const value::Dictionary* file = read.value().asDictionary();
  const value::Value* executable = file ? file->find(kExecutable) : nullptr;
  const value::Value* description = file ? file->find(kDescription) : nullptr;
  const value::Value* started = file ? file->find(kHostStartTime) : nullptr;
  std::int64_t startTime = started ? started->asInt().value_or(-1) : -1;
  if (!executable || !executable->asString() || !description || !description->asDictionary() ||
      startTime < 0) {
    return os::Error{EINVAL, path + ": not a service file"};
  }
  return Contents{*executable->asString(), *description->asDictionary(),
                  static_cast<std::uint64_t>(startTime)};
}

}  // namespace launcher
