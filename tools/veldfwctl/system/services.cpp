// SPDX-License-Identifier: Apache-2.0
// The registry of services.
#include "system/services.h"

#include <json/reader.h>
#include <netdb.h>

#include <filesystem>
#include <fstream>
#include <set>

#include "frame/libraryCall.h"
#include "model/ports.h"

namespace veldfwctl {

namespace {

constexpr const char *DEFINITIONS = "/usr/veld/etc/services.d";

std::vector<std::string> strings(const VLIBCSZLIST *list) {
    std::vector<std::string> texts;
    for (int i = 0; list != nullptr && i < list->nItem; ++i) {
        const char *text = VLIBCSzListGet(list, i);
        texts.emplace_back(text != nullptr ? text : "");
    }
    return texts;
}

/// Names in the definition files; a file that cannot be read defines nothing, here as in the registry.
void definedNamesAdd(std::set<std::string> &names) {
    std::error_code error;
    for (const auto &entry : std::filesystem::directory_iterator(DEFINITIONS, error)) {
        std::ifstream file(entry.path());
        Json::Value definition;
        Json::CharReaderBuilder builder;
        if (entry.path().extension() == ".json" && Json::parseFromStream(builder, file, &definition, nullptr) &&
            definition.isObject() && definition["name"].isString()) {
            names.insert(definition["name"].asString());
        }
    }
}

void databaseNamesAdd(std::set<std::string> &names) {
    setservent(1);
    for (const servent *entry = getservent(); entry != nullptr; entry = getservent()) {
        names.insert(entry->s_name);
    }
    endservent();
}

}  // namespace

ServiceRegistry::ServiceRegistry() {
    require("Cannot read the service registry", "look at /usr/veld/etc/services.d and /etc/services", [this] {
        VELDFWSERVICE_HANDLE handle = nullptr;
        const bool succeeded = VELDFwServiceEnum(&handle) > 0;
        m_handle.reset(handle);
        return succeeded;
    });
}

std::optional<Service> ServiceRegistry::find(const std::string &name) const {
    const VELDFWSERVICE *record = VELDFWServiceFind(m_handle.get(), name.c_str());
    if (record == nullptr) {
        return std::nullopt;
    }
    return Service{name,
                   record->data != 0,
                   record->srcProtocol,
                   strings(record->srcPorts),
                   record->dstProtocol,
                   strings(record->dstPorts)};
}

bool ServiceRegistry::isUsable(const std::string &name) const {
    const std::optional<Service> service = find(name);
    return service && service->isUsable;
}

std::vector<Service> ServiceRegistry::all() const {
    std::set<std::string> names;
    definedNamesAdd(names);
    databaseNamesAdd(names);
    std::vector<Service> services;
    for (const std::string &name : names) {
        if (const std::optional<Service> service = find(name)) {
            services.push_back(*service);
        }
    }
    return services;
}

std::string servicePortsText(const Service &service) {
    std::string text;
    const auto sideAppend = [&text](const std::string &head, int protocol, const std::vector<std::string> &ports) {
        text += (text.empty() ? "" : ", ") + head + portsText(protocol, ports);
    };
    const bool hasPorts = service.destinationProtocol < FW::FW_PROTO_ICMP;
    if (!service.destinationPorts.empty() || !hasPorts) {
        sideAppend("", service.destinationProtocol, service.destinationPorts);
    }
    if (!service.sourcePorts.empty()) {
        sideAppend("from ", service.sourceProtocol, service.sourcePorts);
    }
    return text.empty() ? "none" : text;
}

}  // namespace veldfwctl
