#include "Annexa/AXPlugInLauncher.h"

#include <cerrno>
#include <optional>
#include <string>

#include "Annexa/AXProtocol.h"
#include "platform/launcher/ServiceLauncher.h"
#include "platform/value/Value.h"

namespace {

constexpr const char* kBundleInfo = "bundleInfo";
constexpr const char* kBundleIdentifier = "QFBundleIdentifier";
constexpr const char* kBundleVersion = "QFBundleShortVersionString";

// The string under |key|, when it is one and not empty: the launcher's table has no empty names.
std::optional<std::string> nameIn(const value::Dictionary& info, const char* key) {
  const value::Value* found = info.find(key);
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
  const value::Dictionary* info = AXProtocol::getDictionary(form, kBundleInfo);
  if (!info) return refusal(form, "\"bundleInfo\" dictionary");
  std::optional<std::string> identifier = nameIn(*info, kBundleIdentifier);
  if (!identifier) return refusal(form, "\"QFBundleIdentifier\" in its \"bundleInfo\"");
  std::optional<std::string> version = nameIn(*info, kBundleVersion);
  if (!version) return refusal(form, "\"QFBundleShortVersionString\" in its \"bundleInfo\"");
  return launcher::ServiceLauncher::start(*identifier, *version);
}
