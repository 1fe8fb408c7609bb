// SPDX-License-Identifier: Apache-2.0
// Another user's doings in a test.
#pragma once

#include "processes.h"
#include "sandbox.h"

#include <grp.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <functional>

namespace veldtest {

constexpr uid_t stranger = 65534;

/// Does something as another user, in a child process.
inline int asStranger(const std::function<bool()> &action) {
    return runInChild([&] {
        if (setgroups(0, nullptr) != 0 || setgid(stranger) != 0 || setuid(stranger) != 0)
            return 99;
        return action() ? 0 : 1;
    });
}

}  // namespace veldtest

/// Needs real user ids, which a user namespace does not have.
#define SKIP_WITHOUT_OTHER_USERS()                                                                                     \
    do {                                                                                                               \
        if (geteuid() != 0 || veldtest::sandboxInfo().userNamespace)                                                   \
            GTEST_SKIP() << "not run by the real root, so that there is no other user to plant files";                 \
    } while (false)
