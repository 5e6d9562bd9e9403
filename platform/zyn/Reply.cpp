#include "platform/zyn/Reply.h"

namespace zyn {

const value::Value* Reply::find(const std::string& key) const {
  auto it = fields_.find(key);
  return it == fields_.end() ? nullptr : &it->second;
}

}  // namespace zyn
