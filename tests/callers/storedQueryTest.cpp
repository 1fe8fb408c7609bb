// SPDX-License-Identifier: Apache-2.0
// Block queries of the stored configuration: verdicts, what is read, and what is told when that fails.
#include "files.h"
#include "openCounter.h"
#include "storedConfiguration.h"

#include <gmock/gmock.h>
#include <veld/core.h>
#include <veldfirewall/veldFW.h>
#include <veldfirewall/veldfirewall_c.h>

using namespace FW;
using namespace veldtest;
using testing::IsEmpty;

namespace {

using Verdicts = std::map<std::string, FW_POLICY>;
const PortCompareST tcp80 = {0, FW_PROTO_TCP, "80"};

class StoredQuery : public testing::Test {
protected:
    StoredQuery() {
        storeSettings(true, "home");
        defineService("mixed", "tcp", R"("80", "81", "82-84")");
        defineService("open", "tcp", R"("85")");
        defineService("clock", "udp", R"("123")", Side::source);
    }
    static void storeRules(const std::vector<FWRULE> &rules) {
        storeProfile("1.json", {"home", {{"eth0", rules}}, {{"eth0", FW_POLICY_ALLOW}, {"eth1", FW_POLICY_ALLOW}}});
    }

    SystemLog log;
};

TEST_F(StoredQuery, AServiceIsAsBlockedAsItsWorstPortAndPlainlyAllowedOnlyWhenOpenToAll) {
    FWRULE clockRule = portRule(FW_POLICY_DENY, "123");
    clockRule.portDirect = 1;
    clockRule.protocol = FW_PROTO_UDP;
    const std::tuple<const char *, std::vector<FWRULE>, FW_POLICY> cases[] = {
        {"mixed", {portRule(FW_POLICY_DENY, "84-90")}, FW_POLICY_DENY},
        {"mixed", {portRule(FW_POLICY_DENY, "81", "10.0.0.1")}, FW_POLICY_PARTIAL},
        {"mixed", {portRule(FW_POLICY_DENY, "81", "10.0.0.1"), portRule(FW_POLICY_DENY, "80")}, FW_POLICY_DENY},
        {"mixed", {serviceRule(FW_POLICY_DENY, {"gone", "mixed"})}, FW_POLICY_DENY},
        {"mixed", {serviceRule(FW_POLICY_DENY, {"open"})}, FW_POLICY_ALLOW},
        {"clock", {clockRule}, FW_POLICY_DENY},
    };
    for (const auto &[service, rules, verdict] : cases) {
        storeSettings(true, "home");
        storeRules(rules);
        Verdicts result;
        EXPECT_TRUE(VELDFW().fwServIsBlocked(service, "eth0", result));
        EXPECT_EQ(result, (Verdicts{{"eth0", verdict}, {"global", FW_POLICY_NONE}}));
        const int plain = verdict == FW_POLICY_ALLOW ? 1 : 0;
        EXPECT_EQ(VELDFwPortsCheckAllowByAdapter("eth0", service), plain);
        EXPECT_EQ(VELDFwPortsCheckAllowByAdapter(nullptr, service), plain);
        EXPECT_EQ(VELDFwPortsCheckAllowByAdapter("eth1", service), 1);
        storeSettings(false, "no such profile");
        EXPECT_EQ(VELDFwPortsCheckAllowByAdapter("eth0", service), 1);
    }
    EXPECT_THAT(errorsOf(log), IsEmpty());
}

TEST_F(StoredQuery, SwitchedOffAllowsTheAskedAdapterAndKeepsTheSeverest) {
    storeSettings(false, "no such profile");
    Verdicts result = {{"eth0", FW_POLICY_DENY}, {"old", FW_POLICY_DENY}};
    EXPECT_TRUE(VELDFW().fwPortIsBlocked(tcp80, "", result));
    EXPECT_EQ(result["eth0"], FW_POLICY_DENY);
    EXPECT_TRUE(VELDFW().fwPortIsBlocked(tcp80, "eth0", result));
    EXPECT_EQ(result, (Verdicts{{"eth0", FW_POLICY_ALLOW}, {"old", FW_POLICY_DENY}}));
    for (const char *adapter : {"old", "eth1", ""})
        EXPECT_TRUE(VELDFW().fwServIsBlocked("mixed", adapter, result));
    EXPECT_EQ(result, (Verdicts{{"eth0", FW_POLICY_ALLOW}, {"eth1", FW_POLICY_ALLOW}, {"old", FW_POLICY_DENY}}));
}

TEST_F(StoredQuery, EveryFailureIsToldAndNothingIsThrown) {
    storeRules({serviceRule(FW_POLICY_DENY, {"ssh"}), portRule(FW_POLICY_DENY, "80")});
    writeFile(profileDirectory + "2.json", R"({"name": "odd", "rules": {"eth0": [{"policy": {}}]}})");
    const std::pair<const char *, const char *> cases[] = {
        // settings, last error
        {"{", "veldFW.cpp Failed to check firewall status"},
        {R"({"status": {}, "profile": "home"})", "veldFW.cpp Failed to check firewall status"},
        {R"({"status": true})", "veldFW.cpp Failed to fwProfileConfigGet()"},
        {R"({"status": true, "profile": "gone"})", "veldFW.cpp Failed to profileGet(gone)"},
        {R"({"status": true, "profile": "odd"})", "veldFW.cpp Failed to profileGet(odd)"},
    };
    Verdicts result;
    for (const auto &[settings, error] : cases) {
        SCOPED_TRACE(settings);
        writeFile(settingsFile, settings);
        EXPECT_FALSE(VELDFW().fwPortIsBlocked(tcp80, "eth0", result));
        EXPECT_EQ(lastError(log), error);
        EXPECT_FALSE(VELDFW().fwServIsBlocked("mixed", "eth0", result));
        EXPECT_EQ(lastError(log), "veldFW.cpp Failed to fwPortIsBlocked()");
        EXPECT_EQ(VELDFwPortsCheckAllowByAdapter("eth0", "mixed"), -1);
        EXPECT_EQ(lastError(log), "veldfirewall_c.cpp Failed to check mixed is block or not");
        EXPECT_THAT(result, IsEmpty());
    }
    EXPECT_EQ(VELDFwPortsCheckAllowByAdapter("eth0", nullptr), -1);
    EXPECT_THAT(lastError(log), testing::MatchesRegex("veldfirewall_c\\.cpp Bad parameters\\[0x0D00 "
                                                      "veldfirewall_c\\.cpp:[0-9]+\\]"));
    // A rule whose services cannot be expanded is passed over; a service without ports is not blocked.
    storeSettings(true, "home");
    EXPECT_TRUE(VELDFW().fwServIsBlocked("no-such-service", "eth0", result));
    EXPECT_THAT(result, IsEmpty());
    writeFile("/etc/services", "");
    removeAll("/usr/veld/etc/services.d");
    EXPECT_TRUE(VELDFW().fwPortIsBlocked(tcp80, "eth0", result));
    EXPECT_EQ(result["eth0"], FW_POLICY_DENY);
    EXPECT_FALSE(VELDFW().fwServIsBlocked("ssh", "eth0", result));
    EXPECT_EQ(lastError(log), "veldFW.cpp Failed to servToPorts()");
}

TEST_F(StoredQuery, SettingsAndProfileAreReadOncePerCallHoweverManyPortsTheServiceHas) {
    storeRules({portRule(FW_POLICY_DENY, "80")});
    OpenCounter counter(profileDirectory);
    Verdicts result;
    EXPECT_TRUE(VELDFW().fwServIsBlocked("mixed", "", result));
    // The scan of the directory opens the settings file as well, which is a JSON file beside the profiles.
    EXPECT_EQ(counter.take(), (std::map<std::string, int>{{"1.json", 1}, {"firewall_settings.json", 2}}));
}

}  // namespace
