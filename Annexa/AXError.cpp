#include "Annexa/AXError.h"

std::string AXError::description() const {
  std::string text = os::format("Error Domain=%@ Code=%d", {domain_, code_});
  if (localizedDescription_) text += " \"" + *localizedDescription_ + "\"";
  return text;
}

AXError AXMakeError(std::int64_t code, std::optional<std::string> message) {
  return AXError(AXErrorDomain, code, std::move(message));
}

AXError AXMakeErrorWithFormat(std::int64_t code, const char* format,
                              std::initializer_list<os::FormatArg> arguments) {
  if (!format) return AXMakeError(code, std::nullopt);
  return AXMakeError(code, os::format(format, arguments));
}
