// SPDX-License-Identifier: Apache-2.0
// Files in the sandbox.
#include "files.h"

#include "handle.h"
#include "sandbox.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <sstream>

namespace fs = std::filesystem;

namespace veldtest {
void writeFile(const std::string &path, const std::string &text, mode_t mode) {
    requireSandbox("write " + path);
    makeDirectories(fs::path(path).parent_path().string());
    unlink(path.c_str());
    std::ofstream out(path, std::ios::binary);
    out << text << std::flush;
    if (!out || chmod(path.c_str(), mode) != 0)
        throw systemError("write " + path);
}

std::string readFile(const std::string &path) {
    std::ifstream in(path, std::ios::binary);
    std::ostringstream text;
    if (!in)
        throw systemError("open " + path);
    text << in.rdbuf();
    return text.str();
}

void makeDirectories(const std::string &path, mode_t mode) {
    requireSandbox("make directory " + path);
    if (path.empty() || fs::is_directory(path))
        return;
    fs::create_directories(path);
    if (chmod(path.c_str(), mode) != 0)
        throw systemError("chmod " + path);
}

void installProgram(const std::string &source, const std::string &path) {
    writeFile(path, readFile(source), 0755);
}

std::vector<std::string> listDirectory(const std::string &path) {
    std::vector<std::string> names;
    std::error_code none;
    for (const auto &entry : fs::directory_iterator(path, none))
        names.push_back(entry.path().filename().string());
    std::sort(names.begin(), names.end());
    return names;
}

bool pathExists(const std::string &path) {
    struct stat status = {};
    return lstat(path.c_str(), &status) == 0;
}

void removeAll(const std::string &path) {
    requireSandbox("remove " + path);
    fs::remove_all(path);
}

}  // namespace veldtest
