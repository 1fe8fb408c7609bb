// SPDX-License-Identifier: Apache-2.0
// Writing to the system log.
#include "utils/log.h"

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <vector>

namespace FW {

void logMessage(int priority, const char *source, int line, const char *format, ...) {
    const int savedErrno = errno;
    std::va_list arguments;
    std::va_list measured;
    va_start(arguments, format);
    va_copy(measured, arguments);
    const int length = std::vsnprintf(nullptr, 0, format, measured);
    va_end(measured);
    if (length >= 0) {
        std::vector<char> text(static_cast<size_t>(length) + 1);
        std::vsnprintf(text.data(), text.size(), format, arguments);
        syslog(priority, "%s:%d %s", source, line, text.data());
    }
    va_end(arguments);
    errno = savedErrno;
}

}  // namespace FW
