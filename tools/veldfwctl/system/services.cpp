// SPDX-License-Identifier: Apache-2.0
// The registry of services.
#include "system/services.h"

#include <json/reader.h>
#include <netdb.h>

#include <filesystem>
#include <fstream>
#include <map>
#include <set>

#include "frame/errors.h"
#include "frame/libraryCall.h"
#include "model/ports.h"
#include "system/newFile.h"

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

struct DefinitionFile {
    std::string path;
    bool isImported = false;  ///< written by an import, not by a package or by hand
};

/// The definition files by the name they define. The first file of a name counts, and one that is no JSON defines
/// nothing, here as in the registry, which refuses some others, too.
std::map<std::string, DefinitionFile> definitionFiles() {
    std::set<std::string> paths;
    std::error_code error;
    for (const auto &entry : std::filesystem::directory_iterator(DEFINITIONS, error)) {
        std::error_code gone;
        if (entry.path().extension() == ".json" && entry.path().filename().string().front() != '.' &&
            entry.is_regular_file(gone)) {
            paths.insert(entry.path());
        }
    }
    std::map<std::string, DefinitionFile> files;
    for (const std::string &path : paths) {
        std::ifstream file(path);
        Json::Value definition;
        try {
            Json::CharReaderBuilder builder;
            if (Json::parseFromStream(builder, file, &definition, nullptr) && definition.isObject() &&
                definition["name"].isString()) {
                files.emplace(definition["name"].asString(), DefinitionFile{path, definition.isMember(IMPORTED_FROM)});
            }
        } catch (const Json::Exception &) {  // nested too deeply
            continue;
        }
    }
    return files;
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
    for (const auto &[name, file] : definitionFiles()) {
        names.insert(name);
    }
    databaseNamesAdd(names);
    std::vector<Service> services;
    for (const std::string &name : names) {
        if (const std::optional<Service> service = find(name)) {
            services.push_back(*service);
        }
    }
    return services;
}

void definitionsWrite(const std::vector<std::pair<ServiceDefinition, std::string>> &definitions) {
    const std::map<std::string, DefinitionFile> files = definitionFiles();
    const ServiceRegistry registry;
    for (const auto &[definition, origin] : definitions) {
        const auto defining = files.find(definition.name);
        if (defining != files.end() && !registry.find(definition.name)) {
            throw Failure(defining->second.path + " defines service \"" + definition.name +
                          "\", and the service registry refuses it; mend, move or remove it");
        }
        const std::string path = defining != files.end() ? defining->second.path
                                                         : std::string(DEFINITIONS) + "/" + definition.name + ".json";
        if (defining == files.end() && std::filesystem::exists(std::filesystem::symlink_status(path))) {
            throw Failure(path + " is there and does not define service \"" + definition.name +
                          "\"; mend, move or remove it");
        }
        // A purge takes imported files away, and must not take those of other packages or of the administrator.
        const bool isForeign = defining != files.end() && !defining->second.isImported;
        fileReplace(path, definitionText(definition, isForeign ? "" : origin), 0644,
                    "run this as root, and \"veldfwctl setup\" before it");
    }
}

ServiceDefinition definitionOf(const Service &service) {
    if (!service.isUsable) {
        return {service.name, service.sourceProtocol, {}, service.destinationProtocol, {}};
    }
    return {service.name, service.sourceProtocol, portSet(service.sourcePorts), service.destinationProtocol,
            portSet(service.destinationPorts)};
}

std::string servicePortsText(const Service &service) {
    return sidesText({service.sourceProtocol, service.sourcePorts},
                     {service.destinationProtocol, service.destinationPorts});
}

}  // namespace veldfwctl
