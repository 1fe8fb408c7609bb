// SPDX-License-Identifier: Apache-2.0
// The support for tests holds what it promises.
#include "commandRecorder.h"
#include "files.h"
#include "processes.h"
#include "sandbox.h"

#include <gtest/gtest.h>
#include <unistd.h>

using namespace veldtest;

namespace {

TEST(Sandbox, AnyPathCanBeCreatedOrReplaced) {
    ASSERT_TRUE(inSandbox());
    for (const std::string path :
         {"/usr/veld/etc/firewall.d/1.json", "/etc.defaults/veldinfo.conf", "/var/lock/firewall/a.lock",
          "/sbin/iptables", "/usr/share/xt_geoip/DE.iv4", "/lib/modules/test/modules.dep", "/etc/services",
          "/run/ppp-pppoe.pid", "/tmp/iptables_serv_mod_list"}) {
        writeFile(path, "text of " + path);
        EXPECT_EQ(readFile(path), "text of " + path);
    }
}

TEST(Sandbox, WhatBelongsToTheMachineIsHidden) {
    for (const char *directory : {"/usr/veld", "/var/lock", "/sys/module", "/lib/modules"})
        EXPECT_TRUE(listDirectory(directory).empty()) << directory;
    EXPECT_FALSE(pathExists("/dev/log"));
    EXPECT_EQ(runProgram({"dd", "if=/dev/zero", "of=/dev/full", "count=1"}).status, 1);
    const auto links = runChecked({"ip", "-br", "link", "show"});
    EXPECT_EQ(links.substr(0, 3), "lo ");
    EXPECT_EQ(links.find('\n'), links.size() - 1) << links;
}

TEST(CommandRecorder, ArgumentsAndInheritedDescriptorsAreSeenAsTheyAre) {
    const CommandRecorder recorder;
    const int leaked = dup(1);  // without close-on-exec
    runProgram({"/sbin/iptables", "-A", "two words", "", "x\ny"});
    ASSERT_EQ(recorder.commands().size(), 1u);
    EXPECT_EQ(recorder.commands()[0].arguments, (std::vector<std::string>{"-A", "two words", "", "x\ny"}));
    EXPECT_EQ(recorder.commands()[0].inheritedHandles, std::vector<int>{leaked});
}

}  // namespace
