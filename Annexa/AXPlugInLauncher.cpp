#include "Annexa/AXPlugInLauncher.h"

#include <cerrno>
#include <optional>
#include <string>

#include "platform/launcher/ServiceLauncher.h"
#include "platform/value/Value.h"

namespace {

// The string under |key|, when it is one and not empty: the launcher's table has no empty names.
std::optional<std::string> nameIn(const value::Dictionary& form, const char* key) {
  const value::Value* found = form.find(key);
  const std::string* text = found ? found->asString() : nullptr;
  if (!text || text->empty()) return std::nullopt;
  return *text;
}

os::Error refusal(const value::Dictionary& form, const std::string& missing) {
  const value::Value* uuid = form.find("uuid");
  const std::string* text = uuid ? uuid->asString() : nullptr;
  return os::Error{EINVAL, "form of plug-in " + (text ? *text : std::string("(no uuid)")) +
                               " has no " + missing};
}

}  // namespace

os::Result<pid_t> AXPlugInLauncher::launch(const value::Dictionary& form) {
  std::optional<std::string> identifier = nameIn(form, "identifier");
  if (!identifier) return refusal(form, "\"identifier\"");
  std::optional<std::string> version = nameIn(form, "version");
  if (!version) return refusal(form, "\"version\"");
  return launcher::ServiceLauncher::start(*identifier, *version);
}
