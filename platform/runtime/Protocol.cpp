#include "platform/runtime/Protocol.h"

#include <algorithm>

namespace runtime {

void Protocol::addProtocol(std::shared_ptr<const Protocol> adopted) {
  if (!adopted || adopted.get() == this) return;
  if (std::find(adopted_.begin(), adopted_.end(), adopted) != adopted_.end()) return;
  adopted_.push_back(std::move(adopted));
}

void Protocol::addSelector(std::string selector) {
  if (std::find(selectors_.begin(), selectors_.end(), selector) != selectors_.end()) return;
  selectors_.push_back(std::move(selector));
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
