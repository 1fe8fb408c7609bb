// SPDX-License-Identifier: Apache-2.0
// main() of test programs that run in a sandbox.
#include "sandbox.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <string>

#if defined(__SANITIZE_ADDRESS__)
#include <sanitizer/lsan_interface.h>
#endif

namespace {

int runTests() {
    int result = RUN_ALL_TESTS();
#if defined(__SANITIZE_ADDRESS__)
    if (__lsan_do_recoverable_leak_check() != 0 && result == 0)
        result = 1;
#endif
    return result;
}

}  // namespace

int main(int argc, char **argv) {
    testing::InitGoogleTest(&argc, argv);
    // Listing only: the build does it, perhaps where no sandbox is possible.
    if (testing::GTEST_FLAG(list_tests))
        return RUN_ALL_TESTS();
    return veldtest::runInSandbox(runTests, [](const std::string &reason) {
        const bool mustWork = std::getenv("CI") != nullptr;
        std::printf("%s no sandbox: %s\n", mustWork ? "With CI set that is a failure:" : "[  SKIPPED ]",
                    reason.c_str());
        return mustWork ? 1 : 0;
    });
}
