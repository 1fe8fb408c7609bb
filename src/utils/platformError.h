// SPDX-License-Identifier: Apache-2.0
// The platform's last-error record as messages append it.
#ifndef VELDFIREWALL_SRC_PLATFORMERROR_H
#define VELDFIREWALL_SRC_PLATFORMERROR_H

#include <veld/core.h>

// A format and its arguments, for FW_LOG_ERR.
#define PLATFORM_ERROR_FORMAT "[0x%04X %s:%d]"
#define PLATFORM_ERROR_ARGUMENTS static_cast<unsigned>(VLIBCErrGet()), VLIBCErrorGetFile(), VLIBCErrorGetLine()

#endif
