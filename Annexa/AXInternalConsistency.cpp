#include "Annexa/AXInternalConsistency.h"

#include <cstdlib>

#include "platform/os/Format.h"
#include "platform/os/Log.h"

void AXInternalInconsistencyFailure(std::string_view description, std::string_view source) {
  os::Log::write(3, os::format("internal inconsistency in %@: %@", {source, description}));
  std::abort();
}

void AXAssert(bool condition, std::string_view text, std::string_view source) {
  if (condition) return;
  os::Log::write(3, os::format("assertion failed in %@: %@", {source, text}));
  std::abort();
}
