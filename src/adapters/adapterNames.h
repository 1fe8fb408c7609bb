// SPDX-License-Identifier: Apache-2.0
// The interfaces of the system that rules can be bound to.
#ifndef VELDFIREWALL_SRC_ADAPTERNAMES_H
#define VELDFIREWALL_SRC_ADAPTERNAMES_H

#include <string>
#include <vector>

namespace FW {

/// Appends the names of at most 32 interfaces in the system's order, and then "wlan0" where the system supports
/// wireless, whether or not it is there now.
/// @return the number of interfaces, or a negative number, with the platform's last error set, when they cannot be read
int adapterNamesRead(std::vector<std::string> &names);

}  // namespace FW

#endif
