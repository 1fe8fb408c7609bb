// SPDX-License-Identifier: Apache-2.0
// Block queries of the stored configuration: what is read, how often, and what is told when that fails.
#include "files.h"
#include "storedConfiguration.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/inotify.h>
#include <unistd.h>
#include <veldfirewall/veldFW.h>

#include <array>

using namespace FW;
using namespace veldtest;
using testing::ElementsAre;

namespace {

using Verdicts = std::map<std::string, FW_POLICY>;
const PortCompareST tcp80 = {0, FW_PROTO_TCP, "80"};

FWPROFILE profileWith(const std::vector<FWRULE> &rules) {
    return {"home", {{"eth0", rules}}, {{"eth0", FW_POLICY_ALLOW}, {"global", FW_POLICY_NONE}}};
}

/// How often each file of a directory was opened since the object was made.
class OpenCounter {
public:
    OpenCounter() : handle(inotify_init1(IN_NONBLOCK | IN_CLOEXEC)) {
        inotify_add_watch(handle, profileDirectory.c_str(), IN_OPEN);
    }
    ~OpenCounter() { close(handle); }
    OpenCounter(const OpenCounter &) = delete;
    OpenCounter &operator=(const OpenCounter &) = delete;

    std::map<std::string, int> counts() {
        alignas(inotify_event) std::array<char, 65536> buffer;
        for (ssize_t size = 0; (size = read(handle, buffer.data(), buffer.size())) > 0;) {
            for (const char *at = buffer.data(); at < buffer.data() + size;) {
                const auto *event = reinterpret_cast<const inotify_event *>(at);
                if (event->len > 0)  // not the directory itself
                    ++opened[event->name];
                at += sizeof(inotify_event) + event->len;
            }
        }
        return opened;
    }

private:
    int handle;
    std::map<std::string, int> opened;
};

TEST(StoredQuery, SwitchedOffAllowsTheAskedAdapterWithoutReadingAProfile) {
    storeSettings(false, "no such profile");
    defineService("web", "tcp", "\"80\"");
    SystemLog log;
    Verdicts result = {{"eth0", FW_POLICY_DENY}, {"old", FW_POLICY_DENY}};
    EXPECT_TRUE(VELDFW().fwPortIsBlocked(tcp80, "", result));
    EXPECT_EQ(result, (Verdicts{{"eth0", FW_POLICY_DENY}, {"old", FW_POLICY_DENY}}));
    EXPECT_TRUE(VELDFW().fwPortIsBlocked(tcp80, "eth0", result));
    EXPECT_EQ(result, (Verdicts{{"eth0", FW_POLICY_ALLOW}, {"old", FW_POLICY_DENY}}));
    Verdicts merged = {{"eth0", FW_POLICY_DENY}};  // the severer of the two stays
    EXPECT_TRUE(VELDFW().fwServIsBlocked("web", "eth0", merged));
    EXPECT_TRUE(VELDFW().fwServIsBlocked("web", "eth1", merged));
    EXPECT_TRUE(VELDFW().fwServIsBlocked("web", "", merged));
    EXPECT_EQ(merged, (Verdicts{{"eth0", FW_POLICY_DENY}, {"eth1", FW_POLICY_ALLOW}}));
    EXPECT_THAT(errorsOf(log), ElementsAre());
}

TEST(StoredQuery, EveryFailureIsToldAndNothingIsThrown) {
    defineService("web", "tcp", "\"80\"");
    storeProfile("1.json", profileWith({}));
    writeFile(profileDirectory + "2.json", R"({"name": "odd", "rules": {"eth0": [{"policy": {}}]}})");
    struct Case {
        std::string settings;
        std::vector<std::string> errors;
    };
    const std::string path = settingsFile;
    const Case cases[] = {
        {"{",
         {"utils.cpp Failed to parse Json value of " + path, "veldFW.cpp Falied to configGet()",
          "veldFW.cpp Failed to check firewall status"}},
        {R"({"status": true})",
         {"veldFW.cpp There are no key: profile in config", "veldFW.cpp Failed to fwProfileConfigGet()"}},
        {R"({"status": true, "profile": "gone"})",
         {"fwDB.cpp Failed to profileGet gone due to not exist", "veldFW.cpp Failed to profileGet(gone)"}},
        {R"({"status": {"a": 1}, "profile": "home"})",
         {"veldFW.cpp The value of status in " + path + " is no boolean",
          "veldFW.cpp Failed to check firewall status"}},
        {R"({"status": true, "profile": "odd"})",
         {"veldFW.cpp Ended by an exception: Value is not convertible to Int.",
          "veldFW.cpp Failed to profileGet(odd)"}},
    };
    for (Case entry : cases) {
        SCOPED_TRACE(entry.settings);
        writeFile(settingsFile, entry.settings);
        Verdicts result = {{"eth0", FW_POLICY_PARTIAL}};
        SystemLog log;
        EXPECT_FALSE(VELDFW().fwPortIsBlocked(tcp80, "eth0", result));
        EXPECT_EQ(errorsOf(log), entry.errors);
        log.clear();
        EXPECT_FALSE(VELDFW().fwServIsBlocked("web", "eth0", result));
        entry.errors.emplace_back("veldFW.cpp Failed to fwPortIsBlocked()");
        EXPECT_EQ(errorsOf(log), entry.errors);
        EXPECT_EQ(result, (Verdicts{{"eth0", FW_POLICY_PARTIAL}}));
    }
}

TEST(StoredQuery, AServiceThatIsUnknownHasNoPortsAndAddsNothing) {
    writeFile(settingsFile, "{");  // not even read
    Verdicts result;
    SystemLog log;
    EXPECT_TRUE(VELDFW().fwServIsBlocked("no-such-service", "eth0", result));
    EXPECT_TRUE(result.empty());
    writeFile("/etc/services", "");
    EXPECT_FALSE(VELDFW().fwServIsBlocked("ssh", "eth0", result));
    EXPECT_THAT(errorsOf(log),
                ElementsAre("fwIptables.cpp Failed to enum services", "veldFW.cpp Failed to servToPorts()"));
}

TEST(StoredQuery, AServiceIsAsBlockedAsItsWorstPort) {
    storeSettings(true, "home");
    defineService("mixed", "tcp", "\"80\", \"81\", \"82-84\"");
    defineService("open", "tcp", "\"85\"");
    struct Case {
        std::vector<FWRULE> rules;
        FW_POLICY verdict;
    };
    const Case cases[] = {
        {{}, FW_POLICY_ALLOW},
        {{portRule(FW_POLICY_DENY, "84-90")}, FW_POLICY_DENY},
        {{portRule(FW_POLICY_DENY, "81", "10.0.0.1")}, FW_POLICY_PARTIAL},
        {{portRule(FW_POLICY_DENY, "81", "10.0.0.1"), portRule(FW_POLICY_DENY, "80")}, FW_POLICY_DENY},
        {{serviceRule(FW_POLICY_DENY, {"gone", "mixed"})}, FW_POLICY_DENY},
        {{serviceRule(FW_POLICY_DENY, {"open"})}, FW_POLICY_ALLOW},
    };
    for (const Case &entry : cases) {
        SCOPED_TRACE("case " + std::to_string(&entry - cases));
        storeProfile("1.json", profileWith(entry.rules));
        Verdicts result;
        EXPECT_TRUE(VELDFW().fwServIsBlocked("mixed", "eth0", result));
        EXPECT_EQ(result, (Verdicts{{"eth0", entry.verdict}, {"global", FW_POLICY_NONE}}));
    }
}

TEST(StoredQuery, ARuleWhoseServicesCannotBeExpandedIsPassedOver) {
    storeSettings(true, "home");
    storeProfile("1.json", profileWith({serviceRule(FW_POLICY_DENY, {"ssh"}), portRule(FW_POLICY_DENY, "80")}));
    writeFile("/etc/services", "");
    SystemLog log;
    Verdicts result;
    EXPECT_TRUE(VELDFW().fwPortIsBlocked(tcp80, "eth0", result));
    EXPECT_EQ(result["eth0"], FW_POLICY_DENY);
    EXPECT_THAT(errorsOf(log),
                ElementsAre("fwIptables.cpp Failed to enum services", "veldFW.cpp Failed to servToPorts()"));
}

TEST(StoredQuery, SettingsAndProfileAreReadOncePerCallHoweverManyPortsTheServiceHas) {
    storeSettings(true, "home");
    storeProfile("1.json", profileWith({portRule(FW_POLICY_DENY, "80")}));
    storeProfile("2.json", {"away", {}, {}});
    defineService("many", "tcp+udp", "\"1\", \"2\", \"3\", \"4\", \"5\", \"6\", \"7\"");
    OpenCounter counter;
    Verdicts result;
    EXPECT_TRUE(VELDFW().fwServIsBlocked("many", "", result));
    // The scan of the directory opens the settings file as well, which is a JSON file beside the profiles.
    EXPECT_EQ(counter.counts(),
              (std::map<std::string, int>{{"1.json", 1}, {"2.json", 1}, {"firewall_settings.json", 2}}));
}

}  // namespace
