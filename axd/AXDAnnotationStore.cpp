#include "axd/AXDAnnotationStore.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <ctime>
#include <map>

#include "Annexa/AXInternalConsistency.h"
#include "axd/AXDPlugIn.h"
#include "platform/os/AtomicFile.h"
#include "platform/os/Format.h"
#include "platform/os/Log.h"
#include "platform/os/Paths.h"
#include "platform/os/Probes.h"
#include "platform/value/PropertyList.h"
#include "platform/value/Value.h"

namespace {

constexpr std::string_view kSource = "axd/AXDAnnotationStore";
constexpr std::int64_t kVersionErrorCode = 7;

AXError posixError(const os::Error& error) {
  return AXError(AXPOSIXErrorDomain, error.errnum, error.message);
}

AXError unparsable(const std::string& path, const std::string& why) {
  return AXError(AXPOSIXErrorDomain, EINVAL, path + ": not an annotation database: " + why);
}

// The error that rejects |top| as the contents of the file |path|, or nothing when its "data"
// is a usable table.
std::optional<AXError> rejection(const std::string& path, const value::Dictionary& top) {
  const value::Value* version = top.find("version");
  std::int64_t found = version ? version->integerValue().value_or(0) : 0;
  if (found != AXDAnnotationStore::kVersion) {
    return AXMakeErrorWithFormat(kVersionErrorCode, "found database version %d needed version %d",
                                 {found, AXDAnnotationStore::kVersion});
  }
  const value::Value* data = top.find("data");
  if (!data) return unparsable(path, "it has no \"data\"");
  if (!data->asDictionary()) return unparsable(path, "its \"data\" is not a dictionary");
  return std::nullopt;
}

// Why axd could not have written |annotation| itself, or nothing when it could.
std::optional<std::string> foreignness(const value::Value& annotation) {
  if (!annotation.asDictionary()) return "not a dictionary";
  // What the file cannot hold as XML (a NUL in a string of a binary file) would make every
  // later save fail.
  os::Result<std::string> xml = value::PropertyList::toXml(annotation);
  if (!xml.ok()) return xml.error().message;
  return std::nullopt;
}

// The annotations of |data|, the "data" table of the file |path|. An entry that axd cannot
// have written is skipped with a log line, so one foreign entry cannot cost the user every
// election.
value::Dictionary annotationsIn(const std::string& path, const value::Dictionary& data) {
  std::map<std::string, value::Value> kept;
  for (const auto& [key, annotation] : data) {
    std::optional<std::string> foreign = foreignness(annotation);
    if (!foreign) {
      kept.emplace(key, annotation);
      continue;
    }
    os::Log::notice("skipping annotation \"%@\" of %@: %@", {key, path, *foreign});
  }
  return value::Dictionary(std::move(kept));
}

// The annotation table in the file |path| into |table|, or the error that rejects the file.
std::optional<AXError> readTable(const std::string& path, value::Dictionary* table) {
  os::Result<value::Value> read = value::PropertyList::readFile(path);
  if (!read.ok()) return posixError(read.error());
  const value::Dictionary* top = read.value().asDictionary();
  if (!top) return unparsable(path, "its top level is not a dictionary");
  std::optional<AXError> rejected = rejection(path, *top);
  if (!rejected) *table = annotationsIn(path, *top->find("data")->asDictionary());
  return rejected;
}

}  // namespace

AXDAnnotationStore::AXDAnnotationStore(const char* path)
    : annotationsURL_(path ? std::string(path) : defaultDatabaseURL()) {
  std::optional<AXError> error;
  if (loadDb(&error)) return;
  if (error->domain() == AXPOSIXErrorDomain && error->code() == ENOENT) return;
  rejected_ = true;
  os::Log::notice("unable to load annotation database:%@ error:%@ (resetting)",
                  {annotationsURL_, error->description()});
}

std::string AXDAnnotationStore::defaultDatabaseURL() {
  std::string perUser = os::Paths::perUserDir(geteuid());
  if (perUser.empty()) {
    AXInternalInconsistencyFailure(os::format("unable to locate user directory: errno %d", {errno}),
                                   kSource);
  }
  std::string directory = perUser + "/" + AXD_VENDOR_PREFIX + ".annexa";
  os::Status made = os::Paths::ensureDirectory(directory, 0700);
  if (!made.ok()) {
    AXInternalInconsistencyFailure(
        os::format("unable to create plugin annotations directory:%@ error:%@",
                   {directory, posixError(made.error()).description()}),
        kSource);
  }
  return directory + "/Annotations";
}

std::optional<value::Dictionary> AXDAnnotationStore::annotationForIdentifier(
    const std::string& key) const {
  const value::Value* annotation = annotations_.find(key);
  if (!annotation || !annotation->asDictionary()) return std::nullopt;
  return *annotation->asDictionary();
}

std::optional<value::Dictionary> AXDAnnotationStore::annotationForPlugIn(
    const AXDPlugIn& plugIn) const {
  return annotationForIdentifier(plugIn.annotationKey());
}

std::optional<AXError> AXDAnnotationStore::setAnnotation(
    const std::optional<value::Dictionary>& annotation, const AXDPlugIn& plugIn) {
  const std::string& key = plugIn.annotationKey();
  value::Dictionary saved = annotations_;
  if (annotation) {
    std::map<std::string, value::Value> merged =
        annotationForIdentifier(key).value_or(value::Dictionary()).toMap();
    for (const auto& [name, entry] : *annotation) merged.insert_or_assign(name, entry);
    annotations_ = annotations_.with(key, value::Value::dictionary(value::Dictionary(merged)));
  } else {
    annotations_ = annotations_.without(key);
  }
  std::optional<AXError> error;
  if (saveDb(&error)) return std::nullopt;
  annotations_ = std::move(saved);
  os::Log::notice("unable to save annotations:%@ error:%@",
                  {annotationsURL_, error->description()});
  return error;
}

bool AXDAnnotationStore::loadDb(std::optional<AXError>* error) {
  value::Dictionary table;
  std::optional<AXError> failure = readTable(annotationsURL_, &table);
  if (!failure) {
    annotations_ = std::move(table);
    return true;
  }
  os::Probes::dbLoad(failure->domain().c_str(), static_cast<std::uint64_t>(failure->code()));
  if (error) *error = std::move(failure);
  return false;
}

bool AXDAnnotationStore::saveDb(std::optional<AXError>* error) {
  if (std::optional<AXError> kept = rejected_ ? keepRejectedFile() : std::nullopt) {
    if (error) *error = std::move(kept);
    return false;
  }
  value::Value top = value::Value::dictionary({
      {"data", value::Value::dictionary(annotations_)},
      {"version", value::Value::integer(kVersion)},
  });
  os::Result<std::string> xml = value::PropertyList::toXml(top);
  os::Status written = xml.ok() ? os::AtomicFile::replace(annotationsURL_, xml.value(),
                                                          os::AtomicFile::Durability::Durable, 0600)
                                : xml.error();
  if (written.ok()) return true;
  if (error) *error = posixError(written.error());
  return false;
}

std::optional<AXError> AXDAnnotationStore::keepRejectedFile() {
  std::string stem = annotationsURL_ + ".rejected-" + std::to_string(std::time(nullptr));
  for (int attempt = 0;; ++attempt) {
    std::string aside = attempt == 0 ? stem : stem + "-" + std::to_string(attempt);
    if (renameat2(AT_FDCWD, annotationsURL_.c_str(), AT_FDCWD, aside.c_str(), RENAME_NOREPLACE) ==
        0) {
      os::Log::notice("kept rejected annotation database as %@", {aside});
      break;
    }
    if (errno == ENOENT) break;
    if (errno != EEXIST || attempt == 100) {
      return posixError(
          os::Error::fromErrno("keep the rejected " + annotationsURL_ + " as " + aside));
    }
  }
  rejected_ = false;
  return std::nullopt;
}
