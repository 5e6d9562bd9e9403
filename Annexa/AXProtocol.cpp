#include "Annexa/AXProtocol.h"

namespace AXProtocol {

const value::Array* getArray(const value::Dictionary& message, const char* key) {
  const value::Value* v = message.find(key);
  return v ? v->asArray() : nullptr;
}

const value::Dictionary* getDictionary(const value::Dictionary& message, const char* key) {
  const value::Value* v = message.find(key);
  return v ? v->asDictionary() : nullptr;
}

}  // namespace AXProtocol
