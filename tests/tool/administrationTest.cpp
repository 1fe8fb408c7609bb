// SPDX-License-Identifier: Apache-2.0
// Every command of docs/administration.md, in its order, on a machine with the shipped profile.
#include <gmock/gmock.h>

#include <cstdlib>
#include <filesystem>
#include <sstream>

#include "files.h"
#include "realIptables.h"
#include "toolFixture.h"

namespace veldtest {

namespace {

/// The lines inside of ```sh blocks.
std::vector<std::string> commandsOf(const std::string &document) {
    std::vector<std::string> commands;
    bool inBlock = false;
    std::istringstream lines(document);
    for (std::string line; std::getline(lines, line);) {
        if (line.rfind("```", 0) == 0) {
            inBlock = line == "```sh";
        } else if (inBlock) {
            commands.push_back(line);
        }
    }
    return commands;
}

TEST_F(ToolTest, EveryCommandOfTheAdministratorsGuideWorks) {
    std::string reason;
    if (!realIptables(&reason)) {
        GTEST_SKIP() << reason;
    }
    removeAll("/usr/veld/etc/firewall.d");
    const std::string profile = readFile(std::string(VELD_DATA_DIR) + "/firewall.d/1.json");
    writeFile("/usr/veld/etc.defaults/firewall.d/1.json", profile);
    makeDirectories("/root");
    // What another firewall manager would have installed, and nothing else of that kind.
    for (const char *directory : {"/etc/firewalld", "/usr/lib/firewalld", "/etc/ufw"}) {
        removeAll(directory);
    }
    writeFile("/usr/lib/firewalld/services/samba.xml", R"(<service><port port="137-138" protocol="udp"/>
        <port port="139" protocol="tcp"/><port port="445" protocol="tcp"/><helper name="netbios-ns"/></service>)");
    const std::string path = std::filesystem::path(VELDFWCTL).parent_path().string() + ":" + std::getenv("PATH");
    ASSERT_EQ(0, setenv("PATH", path.c_str(), 1));
    const std::vector<std::string> commands =
        commandsOf(readFile(std::string(VELD_DATA_DIR) + "/../docs/administration.md"));
    EXPECT_GE(commands.size(), 15u);
    for (const std::string &command : commands) {
        const ProgramResult result = runProgram({"bash", "-c", command});
        EXPECT_EQ(0, result.status) << command << "\n" << result.output << result.errors;
    }
    EXPECT_EQ("office", parseJson(runTool({"status", "--json"}).output)["profile"].asString());
}

}  // namespace

}  // namespace veldtest
