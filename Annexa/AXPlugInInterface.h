#pragma once

#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "Annexa/AXError.h"
#include "platform/runtime/MessageInterface.h"
#include "platform/value/Dictionary.h"

// The host's side of talking to a plug-in: from a discovered form, the message interface of the
// protocol that the plug-in's manifest names, configured the way the host says. Stateless; safe
// to call from any thread.
class AXPlugInInterface {
 public:
  // One selector and the interface specification to apply to it (AXConfigureInterface).
  using Configuration = std::vector<std::pair<std::string, std::string>>;

  // Makes the protocol of the protocol specification in the "info" of |form| (a form as
  // discovery returns it: its plug-in dictionary, merged with the extension point's SDK) with
  // AXProtocolFromSpec, where an app extension that names none speaks "QSObject", and applies
  // |configuration| in order to a new interface of that protocol. Returns null and stores the
  // reason in |error| when it is given: code 4 for a form without a string "identifier", a
  // string "path" and a dictionary "info"; code 12 for a data plug-in (it runs no code), a plug-in
  // that names no protocol or names one that cannot be found or made; code 6 for the first
  // malformed specification of |configuration|.
  static std::shared_ptr<runtime::MessageInterface> make(const value::Dictionary& form,
                                                         const Configuration& configuration,
                                                         std::optional<AXError>* error = nullptr);
};
