// SPDX-License-Identifier: Apache-2.0
// The registry of services.
#ifndef VELDFWCTL_SERVICES_H
#define VELDFWCTL_SERVICES_H

#include <veld/serviceconf.h>

#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "model/serviceImport.h"

namespace veldfwctl {

struct Service {
    std::string name;
    bool isUsable = false;  ///< false: switched off in its definition; rules that name it do nothing
    int sourceProtocol = 0;
    std::vector<std::string> sourcePorts;
    int destinationProtocol = 0;
    std::vector<std::string> destinationPorts;
};

class ServiceRegistry {
public:
    /// Reads the registry. @throws Failure
    ServiceRegistry();

    std::optional<Service> find(const std::string &name) const;
    bool isUsable(const std::string &name) const;
    /// All services that can be enumerated: defined in files, or in the system's services database; sorted.
    std::vector<Service> all() const;

private:
    struct Free {
        void operator()(VELDFWServiceList *list) const { VELDFwServiceFree(list); }
    };
    std::unique_ptr<VELDFWServiceList, Free> m_handle;
};

/// What rules that name the service match: nothing when it is switched off.
ServiceDefinition definitionOf(const Service &service);

/// Writes definitions, each in the place of what defined its name before, or else in a file of its own.
/// @param definitions with the files that they come from
/// @throws Failure at the first that cannot be written; those before it are there
void definitionsWrite(const std::vector<std::pair<ServiceDefinition, std::string>> &definitions);

/// "139,445/tcp, from 68/udp".
std::string servicePortsText(const Service &service);

}  // namespace veldfwctl

#endif
