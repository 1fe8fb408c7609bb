// SPDX-License-Identifier: Apache-2.0
// The examples, built against an installed tree, at work on the shipped data and the real kernel.
#include "connections.h"
#include "files.h"
#include "network.h"
#include "processes.h"
#include "realIptables.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdlib>

using namespace veldtest;
using testing::HasSubstr;
using testing::Not;

namespace {

constexpr int done = 0;
constexpr int blocked = 1;
constexpr int failed = 3;

std::string examples() {
    const char *directory = std::getenv("VELD_EXAMPLES");
    return directory != nullptr ? directory : "";
}

class Examples : public testing::Test {
protected:
    void SetUp() override {
        ASSERT_NE(examples(), "") << "VELD_EXAMPLES names the directory that buildExamples.sh left";
        const std::string staged = examples() + "/stage/usr/veld/.";
        runChecked({"cp", "-a", staged, "/usr/veld"});
        runChecked({"cp", "/usr/veld/etc.defaults/firewall.d/1.json", "/usr/veld/etc/firewall.d/"});
        // The shipped list would load modules into the machine's kernel; these names no kernel knows.
        writeFile("/usr/veld/etc.defaults/iptables_modules_list",
                  "KERNEL_MODULES_CORE=\"test_a.ko\"\nKERNEL_MODULES_COMMON=\"test_b.ko\"\nIPV6_MODULES=\"test_c.ko\"\n"
                  "KERNEL_MODULES_NAT=\"test_d.ko\"\n");
        const std::string library = runChecked({"find", examples() + "/installed", "-name", "libveldfirewall.so.1"});
        setenv("LD_LIBRARY_PATH", library.substr(0, library.rfind('/')).c_str(), 1);
    }

    /// Runs a shell line in which the programs have no path, and expects its exit status.
    static std::string expectStatus(int status, const std::string &line) {
        const auto result = runProgram({"sh", "-c", "PATH=" + examples() + "/bin:$PATH; " + line});
        EXPECT_EQ(result.status, status) << line << "\n" << result.output << result.errors;
        return result.output;
    }
};

TEST_F(Examples, DoWhatTheyPromiseOnTheRealKernel) {
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
    EchoServer server({22, 8080});
    const auto reach = [&](uint16_t port) { return probeTcp({"10.1.0.1", port}, &client); };

    EXPECT_THAT(expectStatus(done, "profiles list"), HasSubstr("* default: "));
    expectStatus(done, "profiles on");
    EXPECT_THAT(listRules("/sbin/iptables", "INPUT_FIREWALL"), Not(testing::SizeIs(1)));

    expectStatus(done, "blocked --deny ssh");
    EXPECT_THAT(expectStatus(blocked, "blocked ssh"), HasSubstr("ssh: blocked"));
    expectStatus(blocked, "blocked ssh eth0");
    EXPECT_EQ(reach(22), ProbeResult::timedOut);
    expectStatus(done, "blocked --allow ssh,http");
    EXPECT_THAT(expectStatus(done, "blocked ssh"), HasSubstr("ssh: open"));
    EXPECT_EQ(reach(22), ProbeResult::connected);

    EXPECT_EQ(reach(8080), ProbeResult::connected);
    EXPECT_THAT(expectStatus(done, "echo no | profiles try default global 10.1.0.2"), HasSubstr("on trial"));
    EXPECT_EQ(reach(8080), ProbeResult::connected);
    expectStatus(done, "echo keep | profiles try default global 10.1.0.2 10.1.0.2");
    EXPECT_EQ(reach(8080), ProbeResult::timedOut);
    EXPECT_THAT(expectStatus(blocked, "profiles ask 8080 tcp"), HasSubstr("global: blocked for some addresses"));
    EXPECT_THAT(expectStatus(done, "profiles list"), Not(HasSubstr(".test_")));
    expectStatus(done, "profiles deny default eth0 10.1.0.3");
    EXPECT_THAT(listRules("/sbin/iptables", "INPUT_FIREWALL"),
                testing::Contains("-A INPUT_FIREWALL -s 10.1.0.3/32 -i eth0 -j DROP"));

    expectStatus(done, "blocked --rename eth0 eth9");
    EXPECT_THAT(expectStatus(blocked, "profiles ask 8080 tcp"), HasSubstr("eth9: "));
    expectStatus(done, "blocked --forget ssh");
    expectStatus(done, "blocked --update");
    expectStatus(done,
                 "blocked --load nas && blocked --load nas nat && blocked --unload nas nat && blocked --unload nas");
    expectStatus(done, "blocked --off");
    EXPECT_THAT(listRules("/sbin/iptables", "INPUT_FIREWALL"), testing::SizeIs(1));
    expectStatus(done, "profiles on && profiles off");
}

TEST_F(Examples, TellWhenTheConfigurationCannotBeRead) {
    writeFile("/usr/veld/etc/firewall.d/firewall_settings.json", "{");
    expectStatus(failed, "blocked ssh");
    expectStatus(failed, "blocked --rename eth0 eth1");
    expectStatus(failed, "profiles ask 80 tcp");
    writeFile("/usr/veld/etc/firewall.d/firewall_settings.json", R"({"status": true, "profile": "odd"})");
    writeFile("/usr/veld/etc/firewall.d/2.json", R"({"name": "odd", "rules": {"eth0": [{"policy": {}}]}})");
    expectStatus(failed, "blocked --update");
    expectStatus(failed, "profiles list");
}

}  // namespace
