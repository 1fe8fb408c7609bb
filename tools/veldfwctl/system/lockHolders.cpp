// SPDX-License-Identifier: Apache-2.0
// Which processes hold locks on files.
#include "system/lockHolders.h"

#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>

namespace veldfwctl {

namespace {

namespace fs = std::filesystem;

bool isLocked(const fs::path &descriptorInfo) {
    std::ifstream file(descriptorInfo);
    for (std::string line; std::getline(file, line);) {
        if (line.rfind("lock:", 0) == 0) {
            return true;
        }
    }
    return false;
}

}  // namespace

std::vector<LockHolder> lockHoldersFind(const std::vector<std::string> &directories) {
    std::vector<LockHolder> holders;
    std::error_code error;
    for (const auto &process : fs::directory_iterator("/proc", error)) {
        const std::string id = process.path().filename();
        if (id.find_first_not_of("0123456789") != std::string::npos) {
            continue;
        }
        // Processes and descriptors come and go meanwhile; what has gone holds nothing.
        std::error_code gone;
        for (fs::directory_iterator entry(process.path() / "fd", gone), end; !gone && entry != end;
             entry.increment(gone)) {
            std::error_code closed;
            const std::string path = fs::read_symlink(entry->path(), closed);
            const bool isOurs = std::any_of(directories.begin(), directories.end(), [&path](const auto &directory) {
                return path.rfind(directory, 0) == 0 && path.find(".lock", directory.size()) != std::string::npos;
            });
            if (!closed && isOurs && isLocked(process.path() / "fdinfo" / entry->path().filename())) {
                std::string name;
                std::ifstream(process.path() / "comm") >> name;
                holders.push_back({path, std::stoi(id), name});
            }
        }
    }
    return holders;
}

}  // namespace veldfwctl
