// SPDX-License-Identifier: Apache-2.0
// Lets each test start with an empty sandbox, also when one run of the program has them all. To be compiled in.
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
        for (const std::string directory :
             {"/tmp/", "/run/", "/var/lock/", "/usr/veld/", "/etc.defaults/", "/usr/share/xt_geoip/"}) {
            for (const std::string &name : listDirectory(directory)) {
                if (name != "lock" && name != "netns")  // mount points
                    removeAll(directory + name);
            }
        }
        for (unsigned int index = 2; index < 1000; ++index) {
            char name[IF_NAMESIZE];
            if (if_indextoname(index, name) != nullptr)
                runProgram({"ip", "link", "del", name});  // may have gone with its namespace meanwhile
        }
    }
};

const bool registered = [] {
    testing::UnitTest::GetInstance()->listeners().Append(new CleanStart);
    return true;
}();

}  // namespace
