// SPDX-License-Identifier: Apache-2.0
// Finds and reads the service definitions of other firewall managers.
#ifndef VELDFWCTL_FOREIGNSERVICES_H
#define VELDFWCTL_FOREIGNSERVICES_H

#include <map>
#include <string>
#include <vector>

#include "model/foreignService.h"

namespace veldfwctl {

/// Where other managers keep their services: what administrators changed comes before what packages bring.
const std::vector<std::string> &foreignServicePlaces();

/// Reads files, and all definition files of directories. What cannot be read is in the result with its error.
std::vector<ForeignService> foreignServicesRead(const std::vector<std::string> &places);

/// Finds included services: among those that were read, next to the includer, and in the standard places.
class IncludedServices {
public:
    /// @param read must live as long as this
    explicit IncludedServices(const std::vector<ForeignService> &read);
    /// @return null when there is none; it lives as long as this
    const ForeignService *find(const std::string &name, const ForeignService &includer);

private:
    std::map<std::string, const ForeignService *> m_read;
    std::map<std::string, ForeignService> m_files;  ///< by path; files that were read for this
};

}  // namespace veldfwctl

#endif
