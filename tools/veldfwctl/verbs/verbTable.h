// SPDX-License-Identifier: Apache-2.0
// All verbs of the tool.
#ifndef VELDFWCTL_VERBTABLE_H
#define VELDFWCTL_VERBTABLE_H

#include <CLI/CLI.hpp>

#include "frame/context.h"

namespace veldfwctl {

/// Adds every verb to the application, in the order of the help text.
void registerAllVerbs(CLI::App &app, Context &context);

}  // namespace veldfwctl

#endif
