#pragma once

#include <string>
#include <utility>
#include <variant>

namespace os {

// A failed platform call: the system's error number (errno) and a short text for logs.
struct Error {
  int errnum = 0;
  std::string message;

  // An Error for the current errno, with |what| naming the call that failed.
  static Error fromErrno(std::string what);
};

// Either a value or the Error that prevented it. Callers test ok() before value().
template <typename T>
class Result {
 public:
  Result(T value) : state_(std::move(value)) {}
  Result(Error error) : state_(std::move(error)) {}

  bool ok() const { return state_.index() == 0; }
  const T& value() const& { return std::get<0>(state_); }
  T& value() & { return std::get<0>(state_); }
  T&& value() && { return std::get<0>(std::move(state_)); }
  const Error& error() const { return std::get<1>(state_); }

 private:
  std::variant<T, Error> state_;
};

// The result of a platform call that yields nothing on success.
using Status = Result<std::monostate>;

inline Status success() {
  return Status(std::monostate{});
}

}  // namespace os
