// Functions and globals of the libusbadapter.so that Java loaded which the
// library does not export (the print up-calls and queries, the reader's flags).
// They are found in the library's own symbol table (.symtab), by demangled
// name, so a test reaches the very code and state the JVM runs with. A
// stripped library fails the lookup.
#pragma once

#include <gtest/gtest.h>

#include "usbadapter/types.h"

namespace hidden {

// Address of the function (by signature, "f(int)") or global (by name), or
// null (with a test failure) when it is not there.
void *Find(const char *name);

template <typename Fn>
Fn *Function(const char *signature) {
    return reinterpret_cast<Fn *>(Find(signature));
}

template <typename T>
T *Variable(const char *name) {
    return static_cast<T *>(Find(name));
}

}  // namespace hidden
