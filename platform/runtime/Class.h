#pragma once

#include <functional>
#include <string>

#include "platform/value/Value.h"

namespace runtime {

// A named class of message arguments: its test says which values are its instances. Values of
// several classes are possible (a file URL string is a String too). Immutable; safe to use from
// any thread, provided the test is.
class Class {
 public:
  using Test = std::function<bool(const value::Value&)>;

  Class(std::string name, Test test) : name_(std::move(name)), test_(std::move(test)) {}
  Class(const Class&) = delete;
  Class& operator=(const Class&) = delete;

  const std::string& name() const { return name_; }
  bool isInstance(const value::Value& argument) const { return test_(argument); }

 private:
  std::string name_;
  Test test_;
};

}  // namespace runtime
