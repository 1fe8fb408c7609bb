// SPDX-License-Identifier: Apache-2.0
// How far a list of commands has been run, and how that is shown.
#ifndef VELDFWCTL_PROGRESSTEXT_H
#define VELDFWCTL_PROGRESSTEXT_H

#include <cstddef>
#include <string>
#include <vector>

namespace veldfwctl {

/// The number of commands done when `running` is under way: its position at or after `done`. `done` itself when it is
/// none of the list.
size_t commandsDone(const std::vector<std::string> &commands, size_t done, const std::string &running);

/// "Applying office  [######......]  120 of 240 commands, 3 s"; without the bar when `total` is 0.
/// @param width columns of the terminal; the line is shorter
std::string progressLine(const std::string &what, size_t done, size_t total, int seconds, size_t width);

}  // namespace veldfwctl

#endif
