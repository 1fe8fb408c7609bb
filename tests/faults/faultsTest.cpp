// SPDX-License-Identifier: Apache-2.0
// Each system call of a dump, an edit, an atomic and a specified reload fails, or is the last of its process.
// VELD_FAULTS=full in the environment: every call and every error; otherwise a part of them, another one in each run of
// a different VELD_SEED.
#include <fcntl.h>
#include <json/json.h>
#include <sys/syscall.h>

#include <cstdlib>
#include <cstring>
#include <iostream>
#include <set>
#include <sstream>

#include "faultRun.h"
#include "files.h"
#include "kernelTest.h"
#include "processes.h"
#include "veldfirewall/utils.h"

using namespace veldtest;

namespace {

bool isFull() {
    const char *form = std::getenv("VELD_FAULTS");
    return form != nullptr && std::string(form) == "full";
}

size_t seed() {
    const char *text = std::getenv("VELD_SEED");
    return text != nullptr ? std::stoul(text) : 0;
}

struct Fault {
    FaultPoint point;
    int error;  ///< or killProcess
    std::string text() const {
        return "call " + std::to_string(point.index) + ", number " + std::to_string(point.number) + ", of process " +
               std::to_string(point.process) + (error == killProcess ? " killed" : std::string(": ") + strerror(error));
    }
};

/// What is tried of the calls of a run without a fault.
/// @param strideOfOwn, strideOfPrograms every how many-th fault of the process itself and of the programs that it runs
std::vector<Fault> faultsOf(const std::function<int()> &operation, size_t strideOfOwn, size_t strideOfPrograms) {
    std::vector<Fault> faults;
    const FaultRun undisturbed = runWithFault(operation);
    EXPECT_EQ(undisturbed.status, 0);
    std::array<size_t, 2> counts = {seed(), seed()};
    for (const FaultPoint &point : undisturbed.points) {
        std::vector<int> errors = errorsOf(point.number);
        errors.push_back(killProcess);
        for (const int error : errors) {
            const bool ofProgram = point.process != 0;
            if (isFull() || counts.at(ofProgram ? 1 : 0)++ % (ofProgram ? strideOfPrograms : strideOfOwn) == 0)
                faults.push_back({point, error});
        }
    }
    return faults;
}

void print(const char *operation, size_t faults, const std::map<std::string, int> &outcomes) {
    std::cout << operation << ": " << faults << (isFull() ? " faults (all)" : " faults");
    for (const auto &[outcome, count] : outcomes)
        std::cout << ", " << outcome << " " << count;
    std::cout << "\n";
}

int asStatus(const std::function<bool()> &operation) {
    try {
        return operation() ? 0 : 1;
    } catch (const std::exception &) {
        return 1;
    }
}

#define SKIP_UNLESS_TRACEABLE()                                                                                        \
    try {                                                                                                              \
        runWithFault([] { return close(open("/", O_RDONLY | O_CLOEXEC)); }, FaultPoint{0, 0, SYS_openat}, EACCES);     \
    } catch (const std::runtime_error &error) {                                                                        \
        GTEST_SKIP() << error.what();                                                                                  \
    }

class StoreFaults : public FirewallTest {};

TEST_F(StoreFaults, LeaveTheOldOrTheNewDocumentAfterADump) {
    SKIP_UNLESS_TRACEABLE();
    const std::string path = "/usr/veld/etc/firewall.d/7.json";
    const auto document = [](const char *name) {
        Json::Value value;
        value["name"] = name;
        for (int i = 0; i < 2000; ++i)  // several pages
            value["filling"].append(i);
        return value;
    };
    const auto stored = [&] {
        Json::Value value;
        EXPECT_TRUE(FW::jsonFileLoad(value, path));
        EXPECT_EQ(value["filling"].size(), 2000u);
        return value["name"].asString();
    };
    const auto dump = [&] { return asStatus([&] { return FW::jsonFileDump(document("new"), path); }); };
    ASSERT_TRUE(FW::jsonFileDump(document("old"), path));
    std::map<std::string, int> outcomes;
    const std::vector<Fault> faults = faultsOf(dump, 1, 1);
    for (const Fault &fault : faults) {
        SCOPED_TRACE(fault.text());
        ASSERT_TRUE(FW::jsonFileDump(document("old"), path));
        const FaultRun run = runWithFault(dump, fault.point, fault.error);
        const std::string name = stored();
        EXPECT_TRUE(name == "new" || (name == "old" && run.status != 0)) << name << " after " << run.status;
        outcomes[(run.status == 0 ? "succeeded" : "failed") + std::string(" and ") + name] += 1;
    }
    ASSERT_TRUE(FW::jsonFileDump(document("next"), path));
    EXPECT_EQ(stored(), "next");
    print("dump", faults.size(), outcomes);
    EXPECT_GT(faults.size(), 20u);
}

TEST_F(StoreFaults, LeaveTheOldOrTheNewProfileAfterAnEdit) {
    SKIP_UNLESS_TRACEABLE();
    const auto profile = [](const std::string &port) {
        FW::FWPROFILE made = profileOf({portRule(port, FW::FW_POLICY_DENY)});
        return made;
    };
    const auto stored = [] {
        FW::FWPROFILE found;
        EXPECT_TRUE(FW::VELDFW_PROFILE().profileGet("default", found));
        return found.rules["eth0"].at(0).portList.at(0);
    };
    const auto edit = [&] {
        return asStatus([&] { return FW::VELDFW_PROFILE().profileSet("default", profile("2")); });
    };
    const auto start = [&] {
        removeAll("/usr/veld/etc/firewall.d");
        writeFile(PROFILE, R"({"name": "default"})");
        return FW::VELDFW_PROFILE().profileSet("default", profile("1"));
    };
    ASSERT_TRUE(start());
    std::map<std::string, int> outcomes;
    const std::vector<Fault> faults = faultsOf(edit, 1, 1);
    for (const Fault &fault : faults) {
        SCOPED_TRACE(fault.text());
        ASSERT_TRUE(start());
        const FaultRun run = runWithFault(edit, fault.point, fault.error);
        const std::string port = stored();
        // A profile whose document cannot be read while names are looked up does not exist: then a second document is
        // made, and the first goes on to count.
        const bool isBeside = run.status == 0 && listDirectory("/usr/veld/etc/firewall.d").size() == 2;
        EXPECT_TRUE(port == "2" || (port == "1" && (run.status != 0 || isBeside))) << port << " after " << run.status;
        outcomes[isBeside          ? "written beside the document that could not be read"
                 : run.status == 0 ? "succeeded and new"
                 : port == "1"     ? "failed and old"
                                   : "failed and new"] += 1;
        EXPECT_EQ(edit(), 0);
    }
    print("edit", faults.size(), outcomes);
    EXPECT_GT(faults.size(), 20u);
}

class ReloadFaults : public KernelTest {
protected:
    void SetUp() override {
        KernelTest::SetUp();
        writeFile("/usr/veld/etc/firewall.d/2.json", R"({"name": "other"})");
        FW::FWPROFILE profile = profileOf({addressRule("", "10.0.0.1"), addressRule("", "fd00::1", FW::FW_IP_TYPE_V6)});
        store(profile);
        profile = profileOf({portRule("80", FW::FW_POLICY_ALLOW), addressRule("", "fd00::2", FW::FW_IP_TYPE_V6)});
        profile.name = "other";
        ASSERT_TRUE(FW::VELDFW_PROFILE().profileSet("other", profile));
    }

    static void activate(const std::string &name) {
        writeFile(SETTINGS, "{\"profile\": \"" + name + "\", \"status\": true}");
    }

    static std::pair<std::string, std::string> rules() {
        return {runChecked({"/sbin/iptables", "-S"}), runChecked({"/sbin/ip6tables", "-S"})};
    }

    /// Every document is whole, and the firewall switched on.
    static void expectDocuments(const std::string &active) {
        EXPECT_EQ(listDirectory("/usr/veld/etc/firewall.d"),
                  (std::vector<std::string>{"1.json", "2.json", "firewall_settings.json"}));
        Json::Value settings;
        EXPECT_TRUE(FW::jsonFileLoad(settings, SETTINGS));
        EXPECT_EQ(settings["profile"].asString(), active);
        EXPECT_TRUE(settings["status"].asBool());
        FW::FWPROFILE profile;
        for (const char *name : {"default", "other"})
            EXPECT_TRUE(FW::VELDFW_PROFILE().profileGet(name, profile));
    }
};

TEST_P(ReloadFaults, LeaveTheOldOrTheNewRulesAfterAnAtomicReload) {
    SKIP_UNLESS_TRACEABLE();
    const auto reload = [this] { return asStatus([this] { return firewall.fwReloadAtomic(true); }); };
    const auto applied = [&](const char *name) {
        activate(name);
        EXPECT_EQ(reload(), 0) << log.text();
        return rules();
    };
    const auto newRules = applied("other");
    const auto oldRules = applied("default");
    activate("other");
    const std::vector<Fault> faults = faultsOf(reload, 7, 43);
    std::map<std::string, int> outcomes;
    for (const Fault &fault : faults) {
        SCOPED_TRACE(fault.text());
        ASSERT_EQ(applied("default"), oldRules) << "the next reload: " << log.text();
        log.clear();
        activate("other");
        const FaultRun run = runWithFault(reload, fault.point, fault.error);
        const auto left = rules();
        if (run.status == 0) {
            EXPECT_TRUE(left == newRules) << log.text();
        } else if (run.status == 1) {
            EXPECT_TRUE(left == oldRules) << log.text();
        } else {
            EXPECT_TRUE(left.first == oldRules.first || left.first == newRules.first) << left.first;
            EXPECT_TRUE(left.second == oldRules.second || left.second == newRules.second) << left.second;
        }
        EXPECT_TRUE(execLockIsFree());
        expectDocuments("other");
        outcomes[run.status == 0 ? "succeeded" : run.status == 1 ? "failed" : "killed"] += 1;
    }
    print("atomic reload", faults.size(), outcomes);
    EXPECT_GT(faults.size(), 50u);
}

TEST_P(ReloadFaults, ArePutRightByTheNextReloadWhenTheSpecifiedOneIsKilled) {
    SKIP_UNLESS_TRACEABLE();
    const auto reload = [this] { return asStatus([this] { return firewall.fwReload(true); }); };
    activate("default");
    ASSERT_EQ(reload(), 0) << log.text();
    const auto expected = rules();
    std::vector<Fault> faults = faultsOf(reload, 53, 1000000);
    std::map<std::string, int> outcomes;
    for (const Fault &fault : faults) {
        if (fault.point.process != 0)
            continue;
        SCOPED_TRACE(fault.text());
        const FaultRun run = runWithFault(reload, fault.point, killProcess);
        EXPECT_EQ(run.status, run.wasStruck ? 128 + SIGKILL : 0);
        outcomes[rules() == expected ? "killed with all rules" : "killed half-way"] += 1;
        EXPECT_TRUE(execLockIsFree());
        expectDocuments("default");
        ASSERT_EQ(reload(), 0) << log.text();
        ASSERT_EQ(rules(), expected);
    }
    print("specified reload", faults.size(), outcomes);
    EXPECT_GT(outcomes["killed half-way"], 0);
}

INSTANTIATE_TEST_SUITE_P(Backend, ReloadFaults, testing::Values("nft", "legacy"),
                         [](const auto &entry) { return std::string(entry.param); });

}  // namespace
