// SPDX-License-Identifier: Apache-2.0
// Another user's doings in a test.
#pragma once

#include "files.h"
#include "processes.h"
#include "sandbox.h"

#include <grp.h>
#include <sys/stat.h>
#include <unistd.h>

namespace veldtest {

/// Does something as another user, in a child process.
inline int asStranger(const std::function<bool()> &action) {
    constexpr uid_t stranger = 65534;
    return runInChild([&] {
        if (setgroups(0, nullptr) != 0 || setgid(stranger) != 0 || setuid(stranger) != 0)
            return 99;
        return action() ? 0 : 1;
    });
}

struct Planted {
    const char *what;
    std::function<bool()> plant;
};

/// What a stranger can put in the place of a file.
inline std::vector<Planted> plantedThings(const std::string &path, const std::string &target, const std::string &text) {
    return {{"file", [=] { return writeFile(path, text, 0666), true; }},
            {"link", [=] { return symlink(target.c_str(), path.c_str()) == 0; }},
            {"link to nothing", [=] { return symlink("/run/nothing", path.c_str()) == 0; }},
            {"FIFO", [=] { return mkfifo(path.c_str(), 0666) == 0; }},
            {"full directory", [=] { return makeDirectories(path + "/x"), true; }}};
}

/// Whether it is a file of this user with that mode.
inline bool isOwnFile(const std::string &path, mode_t mode = 0644) {
    struct stat info {};
    return lstat(path.c_str(), &info) == 0 && info.st_mode == (S_IFREG | mode) && info.st_uid == geteuid();
}

}  // namespace veldtest

/// Needs real user ids, which a user namespace does not have.
#define SKIP_WITHOUT_OTHER_USERS()                                                                                     \
    if (geteuid() != 0 || veldtest::sandboxInfo().userNamespace)                                                       \
    GTEST_SKIP() << "not run by the real root, so that there is no other user to plant files"
