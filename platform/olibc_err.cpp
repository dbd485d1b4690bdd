// Per-thread platform error state: the last platform code with the file and line that
// set it.  Read back right after a failed call, before any other platform call.
#include "olibc.h"

namespace {
thread_local int tlsCode = OLIBC_ERR_NONE;
thread_local const char *tlsFile = "";
thread_local int tlsLine = 0;
}  // namespace

extern "C" {

ORLO_EXPORT void OLIBCErrSetEx(int code, const char *file, int line) {
    tlsCode = code;
    tlsFile = file != nullptr ? file : "";
    tlsLine = line;
}

ORLO_EXPORT int OLIBCErrGet(void) { return tlsCode; }

ORLO_EXPORT const char *OLIBCErrorGetFile(void) { return tlsFile; }

ORLO_EXPORT int OLIBCErrorGetLine(void) { return tlsLine; }

}  // extern "C"
