#include "axd/AXDatabase.h"

bool AXDatabase::initWithDatabase(const char* path) {
  if (path) databasePath_ = path;
  return true;
}
