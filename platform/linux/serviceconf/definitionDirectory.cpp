// SPDX-License-Identifier: Apache-2.0
// The directory of service definition files.
#include "serviceconf/definitionDirectory.h"

#include "common/log.h"
#include "common/trustedFile.h"

#include <algorithm>
#include <dirent.h>
#include <fcntl.h>
#include <memory>

namespace veld {
namespace {

constexpr std::size_t kLargestDefinition = std::size_t{1024} * 1024;

std::vector<std::string> listDefinitions(const std::string &directory) {
    std::vector<std::string> names;
    const std::unique_ptr<DIR, int (*)(DIR *)> stream(opendir(directory.c_str()), closedir);
    if (stream == nullptr) {
        if (errno != ENOENT)
            VELD_LOG(LOG_ERR, "service definitions %s: %s", directory.c_str(), errorText(errno).c_str());
        return names;
    }
    constexpr std::string_view suffix = ".json";
    while (const dirent *entry = readdir(stream.get())) {
        const std::string_view name = entry->d_name;
        if (name.front() != '.' && name.size() > suffix.size() && name.substr(name.size() - suffix.size()) == suffix)
            names.emplace_back(name);
    }
    std::sort(names.begin(), names.end());
    return names;
}

bool readDefinition(const std::string &path, ServiceDefinition &definition, std::string &reason) {
    const OpenedFile file = openRegularFile(path, O_RDONLY, false);
    std::string content;
    if (const int error = file.fd ? readWhole(file.fd.get(), kLargestDefinition, content) : file.error; error != 0) {
        reason = error == EINVAL ? "it is no regular file" : errorText(error);
        return false;
    }
    return parseServiceDefinition(content, definition, reason);
}

}  // namespace

ServicesByName readDefinitionDirectory(const std::string &directory) {
    ServicesByName services;
    for (const std::string &name : listDefinitions(directory)) {
        std::string path = directory;
        path.append("/").append(name);
        ServiceDefinition definition;
        std::string reason;
        if (!readDefinition(path, definition, reason)) {
            VELD_LOG(LOG_ERR, "service definition %s is skipped: %s", path.c_str(), reason.c_str());
            continue;
        }
        const std::string service = definition.name;
        if (!services.emplace(service, std::move(definition)).second)
            VELD_LOG(LOG_ERR, "service definition %s is skipped: an earlier file defines \"%s\"", path.c_str(),
                     service.c_str());
    }
    return services;
}

}  // namespace veld
