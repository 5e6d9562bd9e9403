#pragma once

#include <cstdint>
#include <mutex>
#include <string>
#include <string_view>

namespace os {

// Tells whether anything in one directory changed since it last asked: an entry made, removed,
// renamed, written or changed in its attributes, or the directory itself made, removed or moved.
// One inotify descriptor (close-on-exec, non-blocking) watches the directory, or its nearest
// existing ancestor while it is missing, so that one made later is noticed too. The kernel queues
// an event before the writer's write, rename or unlink returns, so a changed() after that returns
// sees it; changed() costs one read() when nothing changed. When nothing can be watched (no
// inotify, no watch left) the failure is logged once and every changed() says yes, which stays
// correct for a caller that drops what it keeps, only slower. A file in the directory that is a
// symbolic link is not followed: a change of its target is not seen.
//
// Safe for concurrent use from any thread (one mutex).
class DirectoryWatch {
 public:
  // Starts watching |directory|. |what| names what is kept from it, for the log line written when
  // it cannot be watched: "<what>: cannot watch <directory> (<why>): <consequence>".
  DirectoryWatch(std::string directory, std::string what, std::string consequence);
  ~DirectoryWatch();
  DirectoryWatch(const DirectoryWatch&) = delete;
  DirectoryWatch& operator=(const DirectoryWatch&) = delete;

  // Takes the changes queued since the last call; true when there were any, or when the
  // directory cannot be watched.
  bool changed();
  // False once the directory cannot be watched.
  bool watching();

  const std::string& directory() const { return directory_; }

 private:
  // Watches the directory, else its nearest existing ancestor, in place of the current watch;
  // false, with the error of the last directory tried in |why|, when neither can be. Under
  // mutex_.
  bool watch(std::string& why);
  // Whether the event |mask| on |name| of the watch |wd| means that the directory may have
  // changed, and whether the watch must be set again.
  void classify(int wd, std::uint32_t mask, std::string_view name, bool& changed,
                bool& rewatch) const;
  // Stops watching for good, with a log line saying why. Under mutex_.
  void giveUp(const std::string& why);

  const std::string directory_;
  const std::string what_;
  const std::string consequence_;
  std::mutex mutex_;
  int fd_ = -1;
  int watch_ = -1;
  // While an ancestor is watched: the name in it that leads to the directory.
  std::string nextName_;
};

}  // namespace os
