// SPDX-License-Identifier: Apache-2.0
// Finds and reads the service definitions of other firewall managers.
#include "system/foreignServices.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <functional>

namespace veldfwctl {

namespace {

namespace fs = std::filesystem;

constexpr size_t LARGEST_FILE = size_t{1024} * 1024;
constexpr const char *XML_SUFFIX = ".xml";

bool endsWith(const std::string &text, const std::string &end) {
    return text.size() >= end.size() && text.compare(text.size() - end.size(), end.size(), end) == 0;
}

/// What editors and package managers leave beside the files that count.
bool isLeftover(const std::string &name) {
    static const std::vector<std::string> ends = {"~",          ".old",    ".bak",     ".dpkg-new", ".dpkg-old",
                                                  ".dpkg-dist", ".rpmnew", ".rpmsave", ".ucf-dist", ".ucf-old"};
    return name.front() == '.' ||
           std::any_of(ends.begin(), ends.end(), [&name](const std::string &end) { return endsWith(name, end); });
}

/// @return why it failed, or empty
std::string textRead(const std::string &path, std::string &text) {
    // A pipe without a writer must not hold this up.
    const int handle = open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
    if (handle < 0) {
        return std::strerror(errno);
    }
    struct stat status {};
    std::string problem;
    if (fstat(handle, &status) != 0) {
        problem = std::strerror(errno);
    } else if (!S_ISREG(status.st_mode)) {
        problem = "it is no regular file";
    }
    std::vector<char> buffer(size_t{64} * 1024);
    for (ssize_t count = 1; problem.empty() && count != 0;) {
        count = read(handle, buffer.data(), buffer.size());
        if (count < 0 && errno != EINTR) {
            problem = std::strerror(errno);
        }
        text.append(buffer.data(), count > 0 ? static_cast<size_t>(count) : 0);
        if (text.size() > LARGEST_FILE) {
            problem = "it is larger than 1 MiB";
        }
    }
    close(handle);
    if (problem.empty() && text.find('\0') != std::string::npos) {
        problem = "it is no text";
    }
    return problem;
}

std::vector<ForeignService> fileRead(const std::string &path) {
    std::string text;
    if (const std::string problem = textRead(path, text); !problem.empty()) {
        ForeignService unread;
        unread.file = path;
        unread.name = fs::path(path).stem();
        unread.error = path + ": " + problem;
        return {unread};
    }
    if (endsWith(path, XML_SUFFIX) || isXml(text)) {
        return {serviceXmlParse(path, text)};
    }
    return applicationProfilesParse(path, text);
}

std::vector<std::string> filesOf(const std::string &place) {
    std::error_code error;
    if (!fs::is_directory(place, error)) {
        return {place};
    }
    std::vector<std::string> files;
    for (const auto &entry : fs::directory_iterator(place, error)) {
        if (!isLeftover(entry.path().filename()) && !entry.is_directory(error)) {
            files.push_back(entry.path());
        }
    }
    // Of profiles with one name that of the last file counts. Here the first does.
    std::sort(files.begin(), files.end(), std::greater<>());
    return files;
}

}  // namespace

const std::vector<std::string> &foreignServicePlaces() {
    static const std::vector<std::string> places = {"/etc/firewalld/services", "/usr/lib/firewalld/services",
                                                    "/etc/ufw/applications.d"};
    return places;
}

std::vector<ForeignService> foreignServicesRead(const std::vector<std::string> &places) {
    std::vector<ForeignService> services;
    for (const std::string &place : places) {
        for (const std::string &file : filesOf(place)) {
            for (ForeignService &service : fileRead(file)) {
                services.push_back(std::move(service));
            }
        }
    }
    return services;
}

IncludedServices::IncludedServices(const std::vector<ForeignService> &read) {
    for (const ForeignService &service : read) {
        if (endsWith(service.file, XML_SUFFIX) && service.error.empty()) {
            m_read.emplace(service.name, &service);
        }
    }
}

const ForeignService *IncludedServices::find(const std::string &name, const ForeignService &includer) {
    if (const auto found = m_read.find(name); found != m_read.end()) {
        return found->second;
    }
    // Names lead to files of these directories only.
    if (name.empty() || name.front() == '.' || name.find('/') != std::string::npos) {
        return nullptr;
    }
    std::vector<std::string> directories = {fs::path(includer.file).parent_path()};
    directories.insert(directories.end(), foreignServicePlaces().begin(), foreignServicePlaces().end());
    for (const std::string &directory : directories) {
        const std::string path = fs::path(directory) / (name + XML_SUFFIX);
        if (const auto known = m_files.find(path); known != m_files.end()) {
            return &known->second;
        }
        std::error_code error;
        if (fs::exists(path, error)) {
            return &m_files.emplace(path, fileRead(path).front()).first->second;
        }
    }
    return nullptr;
}

}  // namespace veldfwctl
