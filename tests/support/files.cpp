// SPDX-License-Identifier: Apache-2.0
// Files in the sandbox.
#include "files.h"

#include "sandbox.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <system_error>

namespace fs = std::filesystem;

namespace veldtest {
namespace {

std::system_error systemError(const std::string &what) {
    return std::system_error(errno, std::generic_category(), what);
}

}  // namespace

void writeFile(const std::string &path, const std::string &text, mode_t mode) {
    requireSandbox("write " + path);
    makeDirectories(fs::path(path).parent_path().string());
    unlink(path.c_str());
    const int file = open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, mode);
    if (file < 0)
        throw systemError("create " + path);
    size_t done = 0;
    while (done < text.size()) {
        const ssize_t count = write(file, text.data() + done, text.size() - done);
        if (count < 0) {
            const int error = errno;
            close(file);
            throw std::system_error(error, std::generic_category(), "write " + path);
        }
        done += static_cast<size_t>(count);
    }
    fchmod(file, mode);
    close(file);
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
