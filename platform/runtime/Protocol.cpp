#include "platform/runtime/Protocol.h"

#include <algorithm>

namespace runtime {

bool Protocol::addProtocol(std::shared_ptr<const Protocol> adopted) {
  if (isRegistered() || !adopted || !adopted->isRegistered()) return false;
  if (std::find(adopted_.begin(), adopted_.end(), adopted) == adopted_.end()) {
    adopted_.push_back(std::move(adopted));
  }
  return true;
}

bool Protocol::addSelector(std::string selector) {
  if (isRegistered()) return false;
  if (std::find(selectors_.begin(), selectors_.end(), selector) == selectors_.end()) {
    selectors_.push_back(std::move(selector));
  }
  return true;
}

bool Protocol::conformsTo(const Protocol& other) const {
  if (this == &other) return true;
  return std::any_of(adopted_.begin(), adopted_.end(),
                     [&](const auto& adopted) { return adopted->conformsTo(other); });
}

bool Protocol::declares(std::string_view selector) const {
  if (std::find(selectors_.begin(), selectors_.end(), selector) != selectors_.end()) return true;
  return std::any_of(adopted_.begin(), adopted_.end(),
                     [&](const auto& adopted) { return adopted->declares(selector); });
}

}  // namespace runtime
