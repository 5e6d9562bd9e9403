#pragma once

// Turns a plug-in's protocol specification into a protocol of the object runtime, and an
// interface specification into the settings of a message interface. Shared code for hosts; the
// daemon never calls it. Every function is safe to call from any thread (the runtime is
// synchronized); a message interface itself is not, see runtime::MessageInterface.

#include <memory>
#include <optional>
#include <string_view>

#include "Annexa/AXError.h"
#include "platform/runtime/MessageInterface.h"
#include "platform/runtime/Protocol.h"
#include "platform/value/Value.h"

// The root protocol "QSObject", the protocol of every app extension that names none. Registered
// with the process's runtime on the first call; a host whose own protocols adopt it calls this
// before registering them.
std::shared_ptr<const runtime::Protocol> AXRootProtocol();

// The registered protocol named |name|. When there is none: writes "unable to locate protocol
// "<name>" - check that it is defined and not inadvertently optimized away" to the system log,
// stores an error of code 12 with that message in |error| when it is given, and returns null.
std::shared_ptr<const runtime::Protocol> AXLookUpProtocol(std::string_view name,
                                                          std::optional<AXError>* error = nullptr);

// The protocol of |specification|: for a string, AXLookUpProtocol of it; for an array of
// names, the compound protocol "__XX_COMPOUND__<name 1>__<name 2>..." adopting each named
// protocol in order, made and registered on the first call and found by name afterwards
// (threads that race to make it all get the one registered first). Null when a named protocol
// is missing (logged, code 12 in |error|: the half-made compound is dropped, and the next call
// makes it again); when the compound can be neither made nor found (code 12 "unable to create
// compound protocol"); and, without an error, for any other type. An element that is not a
// string stands for its description in the name and is a missing protocol.
std::shared_ptr<const runtime::Protocol> AXProtocolFromSpec(
    const value::Value& specification, std::optional<AXError>* error = nullptr);

// Applies |specification| to |selector| of |interface|: entries separated by ",", each
// "request" or "reply", ":", an argument index (decimal; text that is not a number reads as 0),
// ":", then either a protocol name (the argument is a proxy of that protocol: a nested
// interface) or "{" class names joined by "+" "}" (the argument's allowed classes). Returns
// nothing on success, else an error of code 6 whose message is the offending part: the whole
// specification for an entry without exactly three parts, the kind, an unknown protocol name,
// a class list without its closing brace, the first unknown class name, or "" for an empty
// third part. A failing entry changes nothing; the entries before it stay applied.
std::optional<AXError> AXConfigureInterface(runtime::MessageInterface& interface,
                                            std::string_view selector,
                                            std::string_view specification);
