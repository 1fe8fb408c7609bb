// SPDX-License-Identifier: Apache-2.0
// Faults planted in profiles, and those that must not be seen where there are none.
#include <gmock/gmock.h>
#include <veldfirewall/veldFW.h>

#include <cstdlib>
#include <functional>

#include "files.h"
#include "network.h"
#include "toolFixture.h"

namespace veldtest {
namespace {

using namespace FW;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

class LintTest : public ToolTest {
protected:
    void SetUp() override {
        unsetenv("SSH_CONNECTION");
        ToolTest::SetUp();
        addDummyInterface("eth1");
        addAddress("eth1", "192.168.7.1/24");
        setUp("eth1");
    }

    /// "kind adapter/number" of each finding.
    static std::vector<std::string> findings(const std::vector<std::string> &more = {}) {
        std::vector<std::string> command = {"lint", "--json"};
        command.insert(command.end(), more.begin(), more.end());
        const ProgramResult result = runTool(command);
        std::vector<std::string> found;
        const Json::Value json = parseJson(result.output.empty() ? "{}" : result.output);
        EXPECT_TRUE(json.isMember("findings")) << result.errors;
        for (const Json::Value &finding : json["findings"]) {
            EXPECT_FALSE(finding["why"].asString().empty() || finding["mend"].asString().empty());
            found.push_back(finding["kind"].asString() + " " + finding["adapter"].asString() + "/" +
                            finding["number"].asString());
        }
        EXPECT_EQ(found.empty() ? 0 : 1, result.status);
        return found;
    }

    static void store(const FWPROFILE &profile) { ASSERT_TRUE(VELDFW_PROFILE().profileSet("default", profile)); }

    static FWRULE rule(FW_POLICY policy, const std::string &address, const std::string &port) {
        FWRULE rule;
        rule.policy = policy;
        rule.ipGroup = address.empty() ? FW_IP_GROUP_ANY : FW_IP_GROUP_ADDRESS;
        rule.ipType = address.empty() ? FW_IP_TYPE_BOTH : FW_IP_TYPE_V4;
        if (!address.empty()) {
            rule.ipList = {address};
        }
        rule.portGroup = port.empty() ? FW_PORT_GROUP_ANY : FW_PORT_GROUP_PORT;
        if (!port.empty()) {
            rule.portList = {port};
        }
        return rule;
    }

    /// A profile of several kinds of rules without a fault.
    static FWPROFILE goodProfile() {
        FWRULE country = rule(FW_POLICY_DENY, "", "");
        country.ipGroup = FW_IP_GROUP_COUNTRY;
        country.ipList = {"DE"};
        FWRULE service = rule(FW_POLICY_ALLOW, "", "");
        service.portGroup = FW_PORT_GROUP_SERVICE;
        service.portList = {"ssh", "https"};
        FWRULE outgoing = rule(FW_POLICY_DENY, "172.16.0.9", "");
        outgoing.adapterDirect = 0;
        FWRULE off = rule(FW_POLICY_ALLOW, "", "");
        off.enable = false;
        off.portGroup = FW_PORT_GROUP_SERVICE;
        off.portList = {"nosuch"};
        FWPROFILE profile;
        profile.name = "default";
        profile.rules["global"] = {rule(FW_POLICY_ALLOW, "192.168.7.9", "22")};
        profile.rules["eth0"] = {country, service, outgoing, off, rule(FW_POLICY_DENY, "172.16.0.7", "8000-8010")};
        profile.rules["vpn"] = {rule(FW_POLICY_ALLOW, "172.16.0.8", "80")};
        profile.adapterPolicyMap = {{"eth0", FW_POLICY_ALLOW}, {"eth1", FW_POLICY_DENY}, {"global", FW_POLICY_NONE}};
        return profile;
    }
};

TEST_F(LintTest, TheShippedProfileHasNoFault) {
    removeAll("/usr/veld/etc/firewall.d/1.json");
    for (const std::string &file : listDirectory(VELD_DATA_DIR "/firewall.d")) {
        writeFile("/usr/veld/etc/firewall.d/" + file, readFile(VELD_DATA_DIR "/firewall.d/" + file));
    }
    EXPECT_THAT(findings(), IsEmpty());
    EXPECT_THAT(findings({"--client", "192.168.7.9"}), IsEmpty());
    EXPECT_THAT(findings({"--client", "203.0.113.7"}), ElementsAre("connection global/10"));
}

TEST_F(LintTest, EachPlantedFaultIsFoundAndNothingElse) {
    struct Case {
        std::string finding;  ///< of the rule, appended to those of eth0 as number 6 unless another place is named
        std::function<void(FWRULE &rule, FWPROFILE &profile)> plant;
    };
    using R = FWRULE;
    using P = FWPROFILE;
    const std::vector<Case> cases = {
        {"", [](R &, P &) {}},
        {"service eth0/6",
         [](R &r, P &) {
             r.portGroup = FW_PORT_GROUP_SERVICE, r.portList = {"http", "nosuch"};
         }},
        {"service eth0/6", [](R &r, P &) { r.portGroup = FW_PORT_GROUP_RESERVED, r.portList = {"fax"}; }},
        {"country eth0/6", [](R &r, P &) { r.ipGroup = FW_IP_GROUP_COUNTRY, r.ipList = {"ZZ"}; }},
        {"country eth0/6",
         [](R &r, P &) { r.ipGroup = FW_IP_GROUP_COUNTRY, r.ipList = {"FR"}, r.ipType = FW_IP_TYPE_BOTH; }},
        {"family eth0/6", [](R &r, P &) { r.ipType = FW_IP_TYPE_BOTH; }},
        {"family eth0/6", [](R &r, P &) { r.ipType = FW_IP_TYPE_V6; }},
        {"family eth0/6", [](R &r, P &) { r.ipList = {"2001:db8::1"}; }},
        {"family eth0/6",
         [](R &r, P &) {
             r.ipGroup = FW_IP_GROUP_RANGE, r.ipList = {"198.51.100.1", "2001:db8::1"};
         }},
        {"address eth0/6", [](R &r, P &) { r.ipList = {"host.example"}; }},
        {"port eth0/6", [](R &r, P &) { r.portList = {"70000"}; }},
        {"port eth0/6", [](R &r, P &) { r.portList = {"90-80"}; }},
        {"no-command eth0/6", [](R &r, P &) { r.policy = FW_POLICY_NONE; }},
        {"no-command eth0/6", [](R &r, P &) { r.ipGroup = FW_IP_GROUP_NONE; }},
        {"no-command eth0/6", [](R &r, P &) { r.ipGroup = 9; }},
        {"no-command eth0/6", [](R &r, P &) { r.portGroup = 9; }},
        {"no-command eth0/6", [](R &r, P &) { r.portList.clear(); }},
        {"no-command eth0/6", [](R &r, P &) { r.ipList.clear(); }},
        {"no-command eth0/6", [](R &r, P &) { r.protocol = 5; }},
        {"untranslatable eth0/6", [](R &r, P &) { r.policy = static_cast<FW_POLICY>(9); }},
        {"impossible eth0/6",
         [](R &r, P &) {
             r.ipGroup = FW_IP_GROUP_RANGE, r.ipList = {"198.51.100.9", "198.51.100.1"};
         }},
        {"limit eth0/6", [](R &r, P &) { r.table = std::string(1100, 'x'); }},
        {"adapter eth7/0", [](R &, P &p) { p.rules["eth7"] = {rule(FW_POLICY_DENY, "", "")}; }},
        {"adapter eth7/0", [](R &, P &p) { p.adapterPolicyMap["eth7"] = FW_POLICY_DENY; }},
        {"adapter ppp0/0", [](R &, P &p) { p.adapterPolicyMap["ppp0"] = FW_POLICY_DENY; }},
        // By a range, by ports, by the global list, by two rules together.
        {"shadowed eth0/6", [](R &r, P &) { r.ipList = {"172.16.0.7"}, r.portList = {"8005"}; }},
        {"shadowed eth0/6", [](R &r, P &) { r.ipList = {"10.0.1.7"}; }},
        {"shadowed eth0/6",
         [](R &r, P &) {
             r.ipList = {"172.16.9.9"}, r.portList = {"22", "443"};
         }},
        {"shadowed eth0/6", [](R &r, P &) { r.ipList = {"192.168.7.9"}, r.portList = {"22"}; }},
        {"shadowed eth0/6",
         [](R &r, P &p) {
             r.portList = {"100-900"};
             p.rules["global"].push_back(rule(FW_POLICY_DENY, "198.51.100.7", "1-500"));
             p.rules["global"].push_back(rule(FW_POLICY_ALLOW, "198.51.100.7", "501-1000"));
         }},
        {"adapter lo/0", [](R &, P &p) { p.rules["lo"] = {rule(FW_POLICY_DENY, "", "22")}; }},
    };
    for (const Case &entry : cases) {
        FWPROFILE profile = goodProfile();
        FWRULE planted = rule(FW_POLICY_DENY, "198.51.100.7", "9000");
        entry.plant(planted, profile);
        profile.rules["eth0"].push_back(planted);
        store(profile);
        std::vector<std::string> expected;
        if (!entry.finding.empty()) {
            expected.push_back(entry.finding);
        }
        const auto number = static_cast<size_t>(&entry - cases.data());
        EXPECT_EQ(expected, findings()) << "case " << number << "\n" << runTool({"lint"}).output;
    }
}

TEST_F(LintTest, ACutConnectionIsFoundFromTheEnvironmentOrTheCommandLine) {
    store(goodProfile());  // eth1, to which 192.168.7.0/24 belongs, denies what no rule allows
    EXPECT_THAT(findings({"--client", "192.168.7.9"}), IsEmpty());
    EXPECT_THAT(findings({"--client", "192.168.7.8"}), ElementsAre("connection eth1/0"));
    EXPECT_THAT(findings({"--client", "192.168.7.9:2222"}), ElementsAre("connection eth1/0"));
    EXPECT_THAT(
        runTool({"lint", "--client", "192.168.7.8"}).output,
        HasSubstr("adapter eth1, default policy: drops new connections from 192.168.7.8 to port 22/tcp on eth1"));
    EXPECT_EQ(2, runTool({"lint", "--client", "somebody"}).status);
    EXPECT_EQ(2, runTool({"lint", "--client", "192.168.7.8:x"}).status);
    const std::vector<std::pair<std::string, bool>> sessions = {
        {"192.168.7.9 51000 192.168.7.1 22", false},
        {"192.168.7.8 51000 192.168.7.1 22", true},
        {"::ffff:192.168.7.8 51000 ::ffff:192.168.7.1 22", true},
        {"fe80::5%eth1 51000 fe80::1%eth1 22", true},
        {"fe80::5%eth0 51000 fe80::1%eth0 22", false},
        {"nonsense", false},
    };
    for (const auto &[connection, isCut] : sessions) {
        setenv("SSH_CONNECTION", connection.c_str(), 1);
        EXPECT_EQ(isCut ? 1u : 0u, findings().size()) << connection;
    }
}

}  // namespace
}  // namespace veldtest
