// SPDX-License-Identifier: Apache-2.0
// The last error of each thread.
#include "veld/core.h"

namespace {

struct LastError {
    int code = 0;
    const char *file = "";
    int line = 0;
};
thread_local LastError lastError;

}  // namespace

void VLIBCErrSetEx(int code, const char *file, int line) {
    lastError = {code, file != nullptr ? file : "", line};
}

int VLIBCErrGet(void) {
    return lastError.code;
}

const char *VLIBCErrorGetFile(void) {
    return lastError.file;
}

int VLIBCErrorGetLine(void) {
    return lastError.line;
}
