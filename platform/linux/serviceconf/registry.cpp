// SPDX-License-Identifier: Apache-2.0
// The registry of network services: definition files, then the system's services database.
#include "veld/serviceconf.h"

#include "common/log.h"
#include "serviceconf/definitionDirectory.h"
#include "serviceconf/servicesDatabase.h"

#include <climits>
#include <memory>

namespace {

constexpr char kDefinitionDirectory[] = "/usr/veld/etc/services.d";

using PortList = std::unique_ptr<VLIBCSZLIST, void (*)(PVLIBCSZLIST)>;

PortList makePortList(const std::vector<std::string> &ports) {
    PVLIBCSZLIST list = VLIBCSzListAlloc(static_cast<int>(ports.size()));
    for (const std::string &port : ports) {
        if (list != nullptr && VLIBCSzListPush(&list, port.c_str()) < 0) {
            VLIBCSzListFree(list);
            list = nullptr;
        }
    }
    if (list == nullptr)
        throw std::bad_alloc();
    return {list, VLIBCSzListFree};
}

// A record with what it points to.
struct Service {
    explicit Service(veld::ServiceDefinition from)
        : definition(std::move(from)), source(makePortList(definition.source.ports)),
          destination(makePortList(definition.destination.ports)), record{definition.name.c_str(),
                                                                          definition.enabled ? 1 : 0,
                                                                          veld::protocolKind(definition),
                                                                          definition.source.protocol,
                                                                          source.get(),
                                                                          definition.destination.protocol,
                                                                          destination.get()} {}
    Service(const Service &) = delete;
    Service &operator=(const Service &) = delete;

    veld::ServiceDefinition definition;
    PortList source;
    PortList destination;
    VELDFWSERVICE record;
};

}  // namespace

struct VELDFWServiceList {
    std::map<std::string, Service, std::less<>> services;
};

int VELDFwServiceEnum(VELDFWSERVICE_HANDLE *handle) {
    return veld::guarded(__func__, -1, [&] {
        if (handle == nullptr) {
            VELD_SET_ERROR(veld::kBadParameter);
            return -1;
        }
        *handle = nullptr;
        auto list = std::make_unique<VELDFWServiceList>();
        for (auto &[name, definition] : veld::readDefinitionDirectory(kDefinitionDirectory))
            list->services.try_emplace(name, definition);
        for (veld::ServiceDefinition &definition : veld::definitionsFrom(veld::readServicesDatabase())) {
            const std::string name = definition.name;
            list->services.try_emplace(name, std::move(definition));
        }
        const auto count = list->services.size();
        if (count == 0 || count > INT_MAX) {
            VELD_LOG(LOG_ERR, "no service is defined, neither in %s nor in the services database",
                     kDefinitionDirectory);
            VELD_SET_ERROR(veld::systemErrorCode(ENOENT));
            return 0;
        }
        *handle = list.release();
        return static_cast<int>(count);
    });
}

const VELDFWSERVICE *VELDFWServiceFind(VELDFWSERVICE_HANDLE handle, const char *name) {
    return veld::guarded(__func__, static_cast<const VELDFWSERVICE *>(nullptr), [&]() -> const VELDFWSERVICE * {
        if (handle == nullptr || name == nullptr)
            return nullptr;
        const auto found = handle->services.find(std::string_view(name));
        return found != handle->services.end() ? &found->second.record : nullptr;
    });
}

void VELDFwServiceFree(VELDFWSERVICE_HANDLE handle) {
    delete handle;
}
