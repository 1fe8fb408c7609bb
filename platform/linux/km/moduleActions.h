// SPDX-License-Identifier: Apache-2.0
// Inserting and removing kernel modules.
#pragma once

#include <string>
#include <string_view>
#include <vector>

namespace veld {

// "/some/where/xt_mac.ko.xz", "xt-mac.ko", "xt_mac" -> "xt_mac".
std::string moduleName(std::string_view fileName);

// Inserts, removes the modules in list order for `owner`, who is only named in messages; empty names are skipped.
// `directory` holds the kernel's modules; nullptr is that of the running kernel. False at the first module that exists
// and fails to load, that is loaded and cannot be removed although nobody uses it; the rest is then left as it is.
bool insertModules(const char *owner, const std::vector<std::string> &fileNames, const char *directory);
bool removeModules(const char *owner, const std::vector<std::string> &fileNames, const char *directory);

}  // namespace veld
