#include "Annexa/AXInterfaceBuilder.h"

#include <cctype>
#include <climits>
#include <string>
#include <vector>

#include "Annexa/AXProtocol.h"
#include "platform/os/Log.h"
#include "platform/os/Text.h"
#include "platform/runtime/Runtime.h"

namespace {

// Leading blanks, an optional sign and decimal digits, clamped to the range of int; anything
// else reads as 0.
int integerValue(std::string_view text) {
  std::size_t i = 0;
  while (i < text.size() && std::isspace(static_cast<unsigned char>(text[i]))) ++i;
  bool negative = i < text.size() && text[i] == '-';
  if (i < text.size() && (text[i] == '-' || text[i] == '+')) ++i;
  long long magnitude = 0;
  for (; i < text.size() && std::isdigit(static_cast<unsigned char>(text[i])); ++i) {
    magnitude = std::min(magnitude * 10 + (text[i] - '0'), static_cast<long long>(INT_MAX) + 1);
  }
  long long value = negative ? -magnitude : std::min(magnitude, static_cast<long long>(INT_MAX));
  return static_cast<int>(value);
}

std::shared_ptr<const runtime::Protocol> missingProtocol(std::string_view name,
                                                         std::optional<AXError>* error) {
  std::string message = os::format(
      "unable to locate protocol \"%@\" - check that it is defined and not inadvertently "
      "optimized away",
      {name});
  os::Log::write(3, message);
  if (error) *error = AXMakeError(AXProtocol::kMisconfigured, message);
  return nullptr;
}

std::string elementName(const value::Value& element) {
  const std::string* name = element.asString();
  return name ? *name : element.description();
}

std::shared_ptr<const runtime::Protocol> compoundProtocol(const value::Array& names,
                                                          std::optional<AXError>* error) {
  std::string compoundName = "__XX_COMPOUND";
  for (const value::Value& element : names) compoundName += "__" + elementName(element);
  runtime::Runtime& runtime = runtime::Runtime::shared();
  // Made once and found by name afterwards, which is the common case: look before allocating.
  if (auto existing = runtime.lookUpProtocol(compoundName)) return existing;
  std::shared_ptr<runtime::Protocol> compound = runtime.allocateProtocol(compoundName);
  if (!compound) {
    auto existing = runtime.lookUpProtocol(compoundName);
    if (!existing && error) {
      *error = AXMakeError(AXProtocol::kMisconfigured, "unable to create compound protocol");
    }
    return existing;
  }
  for (const value::Value& element : names) {
    auto adopted = element.asString() ? AXLookUpProtocol(*element.asString(), error)
                                      : missingProtocol(element.description(), error);
    if (!adopted) return nullptr;
    compound->addProtocol(std::move(adopted));
  }
  return runtime.registerProtocol(std::move(compound));
}

AXError malformed(std::string_view part) {
  return AXMakeError(AXProtocol::kMalformedInterface, std::string(part));
}

std::optional<AXError> configureClasses(runtime::MessageInterface& interface,
                                        std::string_view selector, int index, bool reply,
                                        std::string_view classes) {
  if (classes.size() < 2 || classes.back() != '}') return malformed(classes);
  runtime::MessageInterface::ClassSet found;
  for (std::string_view name : os::split(classes.substr(1, classes.size() - 2), '+')) {
    auto c = runtime::Runtime::shared().lookUpClass(name);
    if (!c) return malformed(name);
    found.push_back(std::move(c));
  }
  interface.setClasses(std::move(found), selector, index, reply);
  return std::nullopt;
}

std::optional<AXError> configureEntry(runtime::MessageInterface& interface,
                                      std::string_view selector, std::string_view specification,
                                      std::string_view entry) {
  std::vector<std::string_view> parts = os::split(entry, ':');
  if (parts.size() != 3) return malformed(specification);
  if (parts[0] != "request" && parts[0] != "reply") return malformed(parts[0]);
  bool reply = parts[0] == "reply";
  int index = integerValue(parts[1]);
  std::string_view classes = parts[2];
  // An empty third part names nothing; it is refused before any lookup, so it logs nothing.
  if (classes.empty()) return malformed(classes);
  if (classes.front() == '{') return configureClasses(interface, selector, index, reply, classes);
  auto protocol = AXLookUpProtocol(classes);
  if (!protocol) return malformed(classes);
  interface.setInterface(std::make_shared<runtime::MessageInterface>(std::move(protocol)), selector,
                         index, reply);
  return std::nullopt;
}

}  // namespace

std::shared_ptr<const runtime::Protocol> AXRootProtocol() {
  static const auto root = runtime::Runtime::shared().addProtocol("QSObject", {}, {});
  return root;
}

std::shared_ptr<const runtime::Protocol> AXLookUpProtocol(std::string_view name,
                                                          std::optional<AXError>* error) {
  AXRootProtocol();
  auto protocol = runtime::Runtime::shared().lookUpProtocol(name);
  return protocol ? protocol : missingProtocol(name, error);
}

std::shared_ptr<const runtime::Protocol> AXProtocolFromSpec(const value::Value& specification,
                                                            std::optional<AXError>* error) {
  if (const std::string* name = specification.asString()) return AXLookUpProtocol(*name, error);
  const value::Array* names = specification.asArray();
  return names ? compoundProtocol(*names, error) : nullptr;
}

std::optional<AXError> AXConfigureInterface(runtime::MessageInterface& interface,
                                            std::string_view selector,
                                            std::string_view specification) {
  for (std::string_view entry : os::split(specification, ',')) {
    if (auto failure = configureEntry(interface, selector, specification, entry)) return failure;
  }
  return std::nullopt;
}
