// SPDX-License-Identifier: Apache-2.0
// The platform's registry of services, open for the life of an object.
#ifndef VELDFIREWALL_SRC_SERVICEREGISTRY_H
#define VELDFIREWALL_SRC_SERVICEREGISTRY_H

#include <veld/serviceconf.h>

#include <string>

namespace FW {

class ServiceRegistry {
public:
    ServiceRegistry() : count(VELDFwServiceEnum(&handle)) {}
    ~ServiceRegistry() { VELDFwServiceFree(handle); }
    ServiceRegistry(const ServiceRegistry &) = delete;
    ServiceRegistry &operator=(const ServiceRegistry &) = delete;

    bool isOpen() const { return count > 0; }

    /// Protocol kind of a service (1 tcp, 2 udp, others), or a negative number when it is gone.
    int kindOf(const std::string &name) const {
        const VELDFWSERVICE *service = VELDFWServiceFind(handle, name.c_str());
        return service == nullptr || service->data == 0 ? -1 : service->protocolKind;
    }

private:
    VELDFWSERVICE_HANDLE handle = nullptr;
    int count;
};

}  // namespace FW

#endif
