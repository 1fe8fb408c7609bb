// SPDX-License-Identifier: Apache-2.0
// The manual page and the completions of shells, from the texts of --help.
#ifndef VELDFWCTL_HELPPAGES_H
#define VELDFWCTL_HELPPAGES_H

#include <CLI/CLI.hpp>

#include <string>

namespace veldfwctl {

/// The manual page, section 8, in roff.
std::string manualPage(const CLI::App &app, const std::string &version);
std::string bashCompletion(const CLI::App &app);
std::string zshCompletion(const CLI::App &app);

}  // namespace veldfwctl

#endif
