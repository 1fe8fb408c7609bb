// SPDX-License-Identifier: Apache-2.0
// All verbs of the tool.
#ifndef VELDFWCTL_VERBTABLE_H
#define VELDFWCTL_VERBTABLE_H

#include <CLI/CLI.hpp>

#include <string>

#include "frame/context.h"

namespace veldfwctl {

/// Adds the verb that the first word of the command line names, because to describe all of them takes longer than most
/// of them run; every verb, in the order of the help text, when it names none or one that tells about all.
void registerVerbs(CLI::App &app, Context &context, const std::string &word);

}  // namespace veldfwctl

#endif
