// SPDX-License-Identifier: Apache-2.0
// Adds verbs to the command line.
#ifndef VELDFWCTL_VERB_H
#define VELDFWCTL_VERB_H

#include <CLI/CLI.hpp>

#include <functional>
#include <string>

#include "frame/context.h"
#include "frame/errors.h"

namespace veldfwctl {

/// What a verb is and does.
struct Verb {
    std::string name;
    std::string summary;           ///< one line, for the list of verbs
    std::string example;           ///< command lines, one per line, shown by --help
    std::function<int()> run;      ///< gives an ExitStatus; throws UsageError or Failure
    bool asksForConsent = false;   ///< has --yes
    std::string description = {};  ///< more about it, for --help
};

/// Adds a verb with --help and --json to the application or to a group. Add its options to the result.
CLI::App *verbAdd(CLI::App &parent, Context &context, const Verb &verb);

/// Adds a group of verbs ("profile"), one of which must follow.
CLI::App *verbGroupAdd(CLI::App &parent, const std::string &name, const std::string &summary);

}  // namespace veldfwctl

#endif
