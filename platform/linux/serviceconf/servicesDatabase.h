// SPDX-License-Identifier: Apache-2.0
// Services from the system's services database (getservent).
#pragma once

#include "serviceconf/serviceDefinition.h"

namespace veld {

struct DatabaseEntry {
    std::string name;
    std::vector<std::string> aliases;
    int port = 0;
    std::string protocol;
};

// All entries in their order. The database's cursor belongs to the whole process; calls of this function exclude each
// other.
std::vector<DatabaseEntry> readServicesDatabase();

// One definition per name, in byte order of the names. tcp and udp entries of one name and port make "tcp+udp"; when
// the ports differ, or a name has several entries of a protocol, the tcp entry and the first one count. Names win over
// aliases. Other protocols have no place in port rules and are left out.
std::vector<ServiceDefinition> definitionsFrom(const std::vector<DatabaseEntry> &entries);

}  // namespace veld
