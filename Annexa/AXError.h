#pragma once

#include <cstdint>
#include <initializer_list>
#include <optional>
#include <stdexcept>
#include <string>

#include "platform/os/Format.h"

// The error domain of every error the system makes.
inline constexpr const char* AXErrorDomain = "Annexa";

// An error value: a domain, an integer code and, as its localized description, a message that
// may be absent. Immutable; safe to share between threads.
class AXError {
 public:
  AXError(std::string domain, std::int64_t code, std::optional<std::string> localizedDescription)
      : domain_(std::move(domain)),
        code_(code),
        localizedDescription_(std::move(localizedDescription)) {}

  const std::string& domain() const { return domain_; }
  std::int64_t code() const { return code_; }
  const std::optional<std::string>& localizedDescription() const { return localizedDescription_; }

  // "Error Domain=<domain> Code=<code> \"<message>\"", for logs.
  std::string description() const;

 private:
  std::string domain_;
  std::int64_t code_;
  std::optional<std::string> localizedDescription_;
};

// An error of the Annexa domain with |code| and, when given, |message| as its description.
AXError AXMakeError(std::int64_t code, std::optional<std::string> message);

// AXMakeError with the message formatted from |format| and |arguments| (os::format); a null
// format gives an error without a message.
AXError AXMakeErrorWithFormat(std::int64_t code, const char* format,
                              std::initializer_list<os::FormatArg> arguments);

// The client side's internal-consistency failure: thrown (and catchable) where the daemon breaks
// the protocol. The daemon never throws it.
class AXInternalInconsistency : public std::logic_error {
 public:
  using std::logic_error::logic_error;
};
