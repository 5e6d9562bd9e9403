#pragma once

#include <string>

#include "platform/os/Error.h"

namespace launcher {

// A lock over the whole service table, shared between threads and processes: an flock on
// "<table directory>/.lock". Additions and listings hold it shared, so they run side by side;
// a removal holds it exclusive, so it never races a half-done addition and a listing never sees
// half a removal. The lock is released when the object is destroyed, or by the kernel when its
// process dies. Movable, not copyable; one object is used by one thread at a time.
class TableLock {
 public:
  enum class Mode { Shared, Exclusive };

  // Blocks until the lock of |directory| (which must exist) is held in |mode|. Fails with the
  // errno of opening the lock file or of flock.
  static os::Result<TableLock> acquire(const std::string& directory, Mode mode);

  TableLock(TableLock&& other) noexcept;
  TableLock& operator=(TableLock&& other) noexcept;
  TableLock(const TableLock&) = delete;
  TableLock& operator=(const TableLock&) = delete;
  ~TableLock();

 private:
  explicit TableLock(int fd) : fd_(fd) {}

  int fd_;
};

}  // namespace launcher
