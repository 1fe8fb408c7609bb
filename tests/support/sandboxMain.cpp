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

/// Stands in front of all tests and skips or fails each of them.
class UnavailableSandbox : public testing::EmptyTestEventListener {
public:
    explicit UnavailableSandbox(std::string reason) : m_reason(std::move(reason)) {}
    void OnTestStart(const testing::TestInfo &) override {
        if (std::getenv("CI") != nullptr)
            GTEST_FAIL() << "no sandbox, and with CI set that is a failure: " << m_reason;
        GTEST_SKIP() << "no sandbox: " << m_reason;
    }

private:
    std::string m_reason;
};

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
        testing::UnitTest::GetInstance()->listeners().Append(new UnavailableSandbox(reason));
        return RUN_ALL_TESTS();
    });
}
