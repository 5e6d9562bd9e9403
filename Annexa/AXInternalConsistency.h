#pragma once

#include <string_view>

// The daemon's answer to a broken invariant: it writes one line naming the failed condition and
// the source file to the system log and aborts. Nothing catches it. Safe to call from any thread.

// Writes "internal inconsistency in <source>: <description>" to the log and aborts.
[[noreturn]] void AXInternalInconsistencyFailure(std::string_view description,
                                                 std::string_view source);

// Writes "assertion failed in <source>: <text>" to the log and aborts when |condition| is false;
// otherwise does nothing.
void AXAssert(bool condition, std::string_view text, std::string_view source);
