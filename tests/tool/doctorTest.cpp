// SPDX-License-Identifier: Apache-2.0
// "doctor": each fault that is planted is found, and nothing else.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <unistd.h>

#include "files.h"
#include "model/diagnosis.h"
#include "realIptables.h"
#include "toolFixture.h"

namespace veldtest {

namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

TEST(DiagnosisTest, OtherManagersAreKnownByTheirChainsAndTables) {
    const struct {
        std::string listing;
        std::string tables;
        std::string backend;
        veldfwctl::Verdict verdict;
        std::string text;
    } cases[] = {
        {"-P INPUT ACCEPT\n-N INPUT_FIREWALL\n", "table ip filter\ntable ip6 nat\n", "nft", veldfwctl::Verdict::OK,
         "none"},
        {"-N DOCKER-USER\n-N DOCKER\n", "", "nft", veldfwctl::Verdict::NOTE, "Docker has rules"},
        {"-N ufw-before-input\n", "", "nft", veldfwctl::Verdict::PROBLEM, "ufw has rules"},
        {"", "table inet firewalld\n", "nft", veldfwctl::Verdict::PROBLEM, "firewalld has rules"},
        {"-N MINE\n", "table inet own\n", "nft", veldfwctl::Verdict::NOTE, "chain MINE, nft table inet own"},
        {"", "table ip filter\n", "legacy", veldfwctl::Verdict::PROBLEM, "both apply"},
    };
    for (const auto &item : cases) {
        const auto findings = veldfwctl::othersJudge({item.listing}, item.tables, item.backend);
        ASSERT_EQ(1u, findings.size()) << item.text;
        EXPECT_EQ(item.verdict, findings[0].verdict) << item.text;
        EXPECT_THAT(findings[0].text, HasSubstr(item.text));
    }
}

TEST(DiagnosisTest, ModulesAreFoundLoadedBuiltInAndCompressed) {
    EXPECT_THAT(veldfwctl::modulesMissing({"xt_LOG.ko", "nf_nat.ko", "ip-x.ko", "gone.ko"}, {"nf_nat"},
                                          {"kernel/net/xt_LOG.ko.xz: kernel/net/x_tables.ko", "kernel/net/ip_x.ko"}),
                ElementsAre("gone.ko"));
}

class DoctorTest : public ToolTest {
protected:
    void SetUp() override {
        std::string reason;
        if (!realIptables(&reason)) {
            GTEST_SKIP() << reason;
        }
        ToolTest::SetUp();
        const ProgramResult setup = runTool({"setup"});
        ASSERT_EQ(0, setup.status) << setup.output;
    }
    /// Texts of the problems. The exit status must agree.
    static std::string problems(const std::string &verdict = "problem") {
        const ProgramResult result = runTool({"doctor", "--json"});
        const Json::Value json = parseJson(result.output);
        EXPECT_EQ(json["problems"].asInt() == 0 ? 0 : 1, result.status);
        std::string texts;
        for (const Json::Value &finding : json["findings"]) {
            if (finding["verdict"] == verdict) {
                texts += finding["item"].asString() + ": " + finding["text"].asString() + "\n";
                EXPECT_FALSE(verdict == "problem" && finding["mend"].asString().empty()) << texts;
            }
        }
        return texts;
    }
};

TEST_F(DoctorTest, EveryPlantedFaultIsFoundAndItsMendHelps) {
    EXPECT_THAT(problems(), IsEmpty());
    runChecked({"/sbin/iptables", "-I", "INPUT", "-p", "tcp", "-j", "ACCEPT"});
    runChecked({"/sbin/ip6tables", "-D", "FORWARD", "-j", "FORWARD_FIREWALL"});
    EXPECT_EQ("chains IPv4: jump from INPUT to INPUT_FIREWALL: at position 2\n"
              "chains IPv6: jump from FORWARD to FORWARD_FIREWALL: missing\n",
              problems());
    EXPECT_EQ(0, runTool({"setup"}).status);
    EXPECT_THAT(problems(), IsEmpty());
    writeFile("/usr/veld/etc/firewall.d/firewall_settings.json", R"({"status": false, "profile": "nowhere"})");
    EXPECT_EQ("profiles: the active profile \"nowhere\" is missing\n", problems());
    EXPECT_EQ(0, runTool({"profile", "use", "default"}).status);
    removeAll("/usr/veld/etc.defaults/iptables_modules_list");
    EXPECT_THAT(problems(), HasSubstr("module list: "));
    writeFile("/usr/veld/etc/firewall.d/2.json", "not JSON");
    EXPECT_THAT(problems() + problems("ok"), HasSubstr("profiles: "));
    removeAll("/usr/veld/etc/firewall.d");
    EXPECT_THAT(problems(), HasSubstr("profiles: /usr/veld/etc/firewall.d is missing"));
}

TEST_F(DoctorTest, AMixOfBackendsAndAMissingProgramAreProblems) {
    if (!pathExists("/usr/sbin/ip6tables-legacy")) {
        GTEST_SKIP() << "no ip6tables of the backend legacy";
    }
    removeAll("/sbin/ip6tables");
    ASSERT_EQ(0, symlink("/usr/sbin/ip6tables-legacy", "/sbin/ip6tables"));
    EXPECT_THAT(problems(), HasSubstr("backend: mixed: /sbin/ip6tables: legacy;"));
    removeAll("/sbin/ip6tables");
    EXPECT_THAT(problems(), HasSubstr("programs: /sbin/ip6tables: "));
}

TEST_F(DoctorTest, WhoHoldsALockIsNamed) {
    const std::string path = "/tmp/firewall_iptables_exec.lock";
    writeFile(path, "");
    const int file = open(path.c_str(), O_RDWR | O_CLOEXEC);
    struct flock whole = {};
    whole.l_type = F_WRLCK;
    ASSERT_EQ(0, fcntl(file, F_OFD_SETLK, &whole));
    EXPECT_THAT(problems("note"), HasSubstr(path + " is held by process " + std::to_string(getpid())));
    close(file);
    EXPECT_THAT(problems("note"), testing::Not(HasSubstr("is held")));
}

}  // namespace

}  // namespace veldtest
