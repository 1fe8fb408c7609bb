// SPDX-License-Identifier: Apache-2.0
// The examples, built against an installed tree, at work on the shipped data and the real kernel.
#include "caseTable.h"
#include "connections.h"
#include "files.h"
#include "processes.h"
#include "realIptables.h"

#include <gtest/gtest.h>

#include <cstdlib>

using namespace veldtest;

namespace {

/// Puts the installed programs in the PATH, and what the lines of the cases use.
constexpr const char *preparation = R"(
    PATH=$VELD_EXAMPLES/bin:$PATH
    settings=/usr/veld/etc/firewall.d/firewall_settings.json
    reach() { nsenter --net=/run/netns/client timeout 1 bash -c "exec 2>&- 3<>/dev/tcp/10.1.0.1/$1"; }
    rules() { ip$1tables -S INPUT_FIREWALL | grep -e -A; }
    LD_LIBRARY_PATH=$(dirname $(find $VELD_EXAMPLES/installed -name libveldfirewall.so.1))
    export LD_LIBRARY_PATH
)";

TEST(Examples, DoWhatTheyPromiseOnTheRealKernel) {
    const char *examples = std::getenv("VELD_EXAMPLES");
    ASSERT_NE(examples, nullptr) << "it names the directory that buildExamples.sh left";
    runChecked({"cp", "-a", std::string(examples) + "/stage/usr/veld/.", "/usr/veld"});
    runChecked({"cp", "/usr/veld/etc.defaults/firewall.d/1.json", "/usr/veld/etc/firewall.d/"});
    // The shipped list would load modules into the machine's kernel; these names no kernel knows.
    writeFile("/usr/veld/etc.defaults/iptables_modules_list",
              "KERNEL_MODULES_CORE=\"test_a.ko\"\nKERNEL_MODULES_COMMON=\"test_b.ko\"\nIPV6_MODULES=\"test_c.ko\"\n"
              "KERNEL_MODULES_NAT=\"test_d.ko\"\n");
    std::string reason;
    if (!realIptables(&reason))
        GTEST_SKIP() << "iptables does not work here: " << reason;
    createFirewallChains();
    NetworkNamespace client("client");
    addVethPair("eth0", client, "client0");
    addAddress("eth0", "10.1.0.1/24");
    addAddress("client0", "10.1.0.2/24", &client);
    setUp("eth0");
    setUp("client0", &client);
    const EchoServer server({22, 8080});
    for (const auto &row : readCases(VELD_CASES, 3)) {
        const auto result = runProgram({"sh", "-c", preparation + row[0]});
        EXPECT_EQ(std::to_string(result.status), row[1]) << row[0] << "\n" << result.output << result.errors;
        EXPECT_NE(result.output.find(row[2]), std::string::npos) << row[0] << "\n" << result.output;
    }
}

}  // namespace
