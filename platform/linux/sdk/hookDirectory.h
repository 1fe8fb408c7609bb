// SPDX-License-Identifier: Apache-2.0
// A hook is a directory; running it runs the executables in it.
#pragma once

#include <chrono>
#include <map>
#include <string>
#include <vector>

namespace veld {

// True for relative names such as "net/firewall_enable" that stay below the directory of all hooks.
bool isHookName(const std::string &name);

// The environment `base` (ends with nullptr) as "KEY=value" texts, with the arguments added or put in the place of
// variables of the same name.
std::vector<std::string> environmentWith(const char *const *base, const std::map<std::string, std::string> &arguments);

// Paths of the executable files in the directory, in byte order of their names; names that begin with a dot do not
// count. A missing directory has none. 0 or an errno value.
int listExecutables(const std::string &directory, std::vector<std::string> &paths);

// Runs every executable of the directory, one after the other, with one argument. One that still runs after `time` is
// killed with its process group. False when one failed or the directory cannot be read; each failure is logged.
bool runHookDirectory(const std::string &directory, const char *argument,
                      const std::map<std::string, std::string> &arguments, std::chrono::milliseconds time);

}  // namespace veld
