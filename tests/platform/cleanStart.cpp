// SPDX-License-Identifier: Apache-2.0
// Lets each test start with an empty sandbox, also when one run of the program has them all.
#include "files.h"
#include "network.h"
#include "sandbox.h"

#include <gtest/gtest.h>
#include <net/if.h>

using namespace veldtest;

namespace {

class CleanStart : public testing::EmptyTestEventListener {
    void OnTestStart(const testing::TestInfo &) override {
        if (!inSandbox())
            return;
        for (const std::string directory : {"/tmp/", "/run/", "/var/lock/", "/usr/veld/", "/etc.defaults/"}) {
            for (const std::string &name : listDirectory(directory)) {
                if (directory + name != "/run/lock")
                    removeAll(directory + name);
            }
        }
        for (unsigned int index = 2; index < 1000; ++index) {
            char name[IF_NAMESIZE];
            if (if_indextoname(index, name) != nullptr)
                removeInterface(name);
        }
    }
};

const bool registered = [] {
    testing::UnitTest::GetInstance()->listeners().Append(new CleanStart);
    return true;
}();

}  // namespace
