#include "platform/os/OpenWork.h"

#include <atomic>

namespace os {

namespace {

std::atomic<std::uint64_t> openWork{0};

}  // namespace

void OpenWork::take() {
  openWork.fetch_add(1, std::memory_order_relaxed);
}

bool OpenWork::giveBack() {
  std::uint64_t current = openWork.load(std::memory_order_relaxed);
  do {
    if (current == 0) return false;
  } while (!openWork.compare_exchange_weak(current, current - 1, std::memory_order_relaxed));
  return true;
}

std::uint64_t OpenWork::count() {
  return openWork.load(std::memory_order_relaxed);
}

}  // namespace os
