#include "platform/os/Error.h"

#include <cerrno>
#include <cstring>

namespace os {

Error Error::fromErrno(std::string what) {
  int saved = errno;
  return Error{saved, what + ": " + std::strerror(saved)};
}

}  // namespace os
