// SPDX-License-Identifier: Apache-2.0
// The directory of service definition files.
#pragma once

#include "serviceconf/serviceDefinition.h"

#include <map>

namespace veld {

using ServicesByName = std::map<std::string, ServiceDefinition, std::less<>>;

// Reads the *.json files of the directory in byte order of their names; names that begin with a dot do not count. Of
// several files that define one name the first counts. What cannot be used is logged and skipped; a missing directory
// is empty.
ServicesByName readDefinitionDirectory(const std::string &directory);

}  // namespace veld
