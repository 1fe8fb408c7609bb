// SPDX-License-Identifier: Apache-2.0
// "service import".
#ifndef VELDFWCTL_VERBS_SERVICEIMPORT_H
#define VELDFWCTL_VERBS_SERVICEIMPORT_H

#include "frame/verb.h"

namespace veldfwctl {

/// Adds the verb to the group "service".
void serviceImportAdd(CLI::App &group, Context &context);

}  // namespace veldfwctl

#endif
