// SPDX-License-Identifier: Apache-2.0
// Messages to the system log, each with the place that wrote it, and the last-error record of the calling thread.
#pragma once

#include "veld/core.h"

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <new>
#include <string>
#include <syslog.h>

namespace veld {

// Codes of the last-error record.
inline constexpr int kBadParameter = 0x0D00;
inline constexpr int kUntrustedFile = 0x0F00;
inline constexpr int kInternalError = 0x0C00;
// A failed system call: its errno in the low byte.
inline int systemErrorCode(int error) {
    return 0x0E00 | (error & 0xFF);
}

// Logs "<file>:<line> <message>" and leaves errno as it was.
inline void logAt(int priority, const char *file, int line, const char *format, ...)
    __attribute__((format(printf, 4, 5)));
inline void logAt(int priority, const char *file, int line, const char *format, ...) {
    const int savedErrno = errno;
    char *message = nullptr;
    va_list arguments;
    va_start(arguments, format);
    if (vasprintf(&message, format, arguments) < 0)
        message = nullptr;
    va_end(arguments);
    syslog(priority, "%s:%d %s", file, line, message != nullptr ? message : format);
    free(message);
    errno = savedErrno;
}

// Text of an errno value; safe in threads, unlike strerror().
inline std::string errorText(int error) {
    char buffer[128];
    return strerror_r(error, buffer, sizeof buffer);
}

// Runs the body of a C function: whatever it throws (out of memory, above all) becomes a logged failure.
// Not noexcept: a cancelled thread must be able to unwind through it.
template <typename Result, typename Body> Result guarded(const char *function, Result failure, Body &&body) {
    try {
        return body();
    } catch (const std::bad_alloc &) {
        logAt(LOG_ERR, function, 0, "out of memory");
        errno = ENOMEM;
        VLIBCErrSetEx(systemErrorCode(ENOMEM), function, 0);
    } catch (const std::exception &error) {
        logAt(LOG_ERR, function, 0, "%s", error.what());
        errno = EIO;
        VLIBCErrSetEx(kInternalError, function, 0);
    }
    return failure;
}

}  // namespace veld

#define VELD_LOG(priority, ...) ::veld::logAt((priority), __FILE_NAME__, __LINE__, __VA_ARGS__)
#define VELD_SET_ERROR(code) VLIBCErrSetEx((code), __FILE_NAME__, __LINE__)
