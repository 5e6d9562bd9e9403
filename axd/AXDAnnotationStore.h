#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "Annexa/AXError.h"
#include "platform/value/Dictionary.h"

class AXDPlugIn;

// The domain of errors that carry a system error number (errno) as their code.
inline constexpr const char* AXPOSIXErrorDomain = "POSIX";

// The user's annotations of plug-ins: a table from annotation key (AXDPlugIn::annotationKey) to
// a dictionary, held in memory and kept in one XML property-list file, {"version": 16, "data":
// <table>}, that is read once at construction and rewritten whole after every change.
//
// Thread safety: none of its own. The database owns the one store and makes every call on its
// serial queue; the load runs inside the constructor, before the store is shared. Lookups return
// copies (O(1)); annotations() returns the table itself, which the next change replaces, so a
// caller that keeps it past its queue turn copies it.
//
// Errors that come from the system are of AXPOSIXErrorDomain with the errno as code and the
// system's message (naming the file) as description; a file that is not an annotation database
// is EINVAL. A file of another version is the Annexa error 7, "found database version <found>
// needed version 16".
class AXDAnnotationStore {
 public:
  static constexpr std::int64_t kVersion = 16;

  // The store of the file |path|, taken as given (a relative path is relative to the working
  // directory); null means defaultDatabaseURL(). Loads the file with loadDb; when that fails
  // the table starts empty and, unless the file does not exist (ENOENT), the line "unable to
  // load annotation database:<path> error:<error> (resetting)" is logged. The file is never
  // touched here: a rejected file stays where it is until the first save, which first renames it
  // aside (see saveDb).
  explicit AXDAnnotationStore(const char* path);
  AXDAnnotationStore(const AXDAnnotationStore&) = delete;
  AXDAnnotationStore& operator=(const AXDAnnotationStore&) = delete;

  // "<per-user directory>/<vendor prefix>.annexa/Annotations", the per-user directory being
  // os::Paths::perUserDir of the effective user. Creates the directory, and any missing parents,
  // with mode 0700 (an existing one keeps its mode). Without a per-user directory, or when the
  // directory cannot be made, an internal-consistency failure: the daemon cannot run without
  // its store.
  static std::string defaultDatabaseURL();

  // The annotation stored under |key|, or nothing when there is none (or when the entry is not
  // a dictionary, which only setAnnotations can put there: loading skips such entries).
  std::optional<value::Dictionary> annotationForIdentifier(const std::string& key) const;
  // annotationForIdentifier of |plugIn|'s annotation key.
  std::optional<value::Dictionary> annotationForPlugIn(const AXDPlugIn& plugIn) const;

  // Merges |annotation| into the entry of |plugIn|'s annotation key: each of its entries
  // replaces the entry of that name, the others stay (an entry is created when there is none).
  // A null |annotation| removes the whole entry instead. Then saves. Nothing on success; when
  // the save fails, the change is undone (what is in memory is what the file holds, so nothing
  // unsaved is ever shown or acknowledged), "unable to save annotations:<path> error:<error>" is
  // logged and the save's error returned.
  std::optional<AXError> setAnnotation(const std::optional<value::Dictionary>& annotation,
                                       const AXDPlugIn& plugIn);

  // Replaces the table with the one in annotationsURL(), less its entries that are not
  // dictionaries or that an XML property list cannot hold (a NUL in a string of a binary
  // file), each logged as "skipping annotation "<key>" of <path>: <why>", the reason being
  // "not a dictionary" or the writer's error. On failure returns false, leaves the table as it was,
  // fires the db-load probe with the error's domain and code and, when |error| is not null, stores
  // the error there: ENOENT for a missing file, EINVAL for a file that is not a property list,
  // whose top level or "data" is not a dictionary, or that has no "data"; the Annexa error 7 when
  // the integer value of "version" (0 when missing or not a number) is not 16.
  bool loadDb(std::optional<AXError>* error);

  // Writes the table to annotationsURL() as an XML property list, atomically: the new content
  // goes to a temporary file beside it ("<name>.XXXXXX", mode 0600: the user's elections are
  // no one else's to read), is flushed to disk and renamed over the old file, and the directory is
  // flushed; a reader, or the file after a crash, is the old content or the new, never a part.
  // Returns true when all of it succeeded; otherwise false, with the error stored in |error|
  // when it is not null, the temporary file removed and the old file unchanged. Directories
  // are never created here. When the file was rejected at load (another version, damaged, not
  // a regular file), the first save renames it to "<path>.rejected-<seconds since 1970>" (with
  // "-<n>" added should that exist) and logs "kept rejected annotation database as <path>"
  // before writing; a save that cannot keep it fails and writes nothing.
  bool saveDb(std::optional<AXError>* error);

  // The path of the annotation file.
  const std::string& annotationsURL() const { return annotationsURL_; }
  void setAnnotationsURL(std::string path) { annotationsURL_ = std::move(path); }

  // The whole table: annotation key to annotation.
  const value::Dictionary& annotations() const { return annotations_; }
  void setAnnotations(value::Dictionary annotations) { annotations_ = std::move(annotations); }

 private:
  // Renames the rejected file aside; nothing on success (or when it has gone meanwhile).
  std::optional<AXError> keepRejectedFile();

  std::string annotationsURL_;
  value::Dictionary annotations_;
  // The file at annotationsURL_ was rejected at load and is not yet kept aside.
  bool rejected_ = false;
};
