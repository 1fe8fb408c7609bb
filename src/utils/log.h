// SPDX-License-Identifier: Apache-2.0
// Writing to the system log in the library's form: "source:line message".
#ifndef VELDFIREWALL_SRC_LOG_H
#define VELDFIREWALL_SRC_LOG_H

#include <syslog.h>

namespace FW {

/// Writes one message to the system log. Keeps errno.
/// @param source file name without directory, the name under which administrators filter these messages
void logMessage(int priority, const char *source, int line, const char *format, ...)
    __attribute__((format(printf, 4, 5)));

}  // namespace FW

#define FW_LOG_ERR(...) ::FW::logMessage(LOG_ERR, __FILE_NAME__, __LINE__, __VA_ARGS__)
#define FW_LOG_DEBUG(...) ::FW::logMessage(LOG_DEBUG, __FILE_NAME__, __LINE__, __VA_ARGS__)

#endif
