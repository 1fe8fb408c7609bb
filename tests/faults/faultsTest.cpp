// SPDX-License-Identifier: Apache-2.0
// Each system call of a dump, an edit, an atomic and a specified reload fails, or is the last of its process.
// VELD_FAULTS=full in the environment: every call and every error; otherwise a part of them, another one in each run of
// a different VELD_SEED.
#include <fcntl.h>
#include <json/json.h>
#include <sys/syscall.h>

#include <array>
#include <cstdlib>
#include <cstring>
#include <iostream>

#include "faultRun.h"
#include "files.h"
#include "kernelTest.h"
#include "processes.h"
#include "veldfirewall/utils.h"

using namespace veldtest;

namespace {

const std::string STORE = "/usr/veld/etc/firewall.d/";

bool isFull() {
    const char *form = std::getenv("VELD_FAULTS");
    return form != nullptr && std::string(form) == "full";
}

int asStatus(const std::function<bool()> &operation) {
    try {
        return operation() ? 0 : 1;
    } catch (const std::exception &) {
        return 1;
    }
}

/// An operation that is run once for each fault that is tried of it.
struct Trial {
    const char *name;
    std::function<bool()> operation;
    std::function<void()> start;                              ///< before each run
    std::function<std::string(const FaultRun &run)> outcome;  ///< of a run, checked and in words
    size_t strideOfOwn = 1;       ///< every how many-th fault of the process itself is tried
    size_t strideOfPrograms = 1;  ///< and of the programs that it runs; 0: none
    bool onlyKills = false;
};

/// Prints the figures. @return how often each outcome came
std::map<std::string, int> run(const Trial &trial) {
    const auto operation = [&trial] { return asStatus(trial.operation); };
    trial.start();
    const FaultRun undisturbed = runWithFault(operation);
    EXPECT_EQ(undisturbed.status, 0);
    const char *seed = std::getenv("VELD_SEED");
    std::array<size_t, 2> counts = {};
    counts.fill(seed != nullptr ? std::stoul(seed) : 0);
    int faults = 0;
    int misses = 0;
    std::map<std::string, int> outcomes;
    for (const FaultPoint &point : undisturbed.points) {
        const bool isOwn = point.process == 0;
        const size_t stride = isOwn ? trial.strideOfOwn : trial.strideOfPrograms;
        std::vector<int> errors = trial.onlyKills ? std::vector<int>() : errorsOf(point.number);
        errors.push_back(killProcess);
        for (const int error : errors) {
            if (stride == 0 || (counts.at(isOwn ? 0 : 1)++ % stride != 0 && !isFull()) ||
                testing::Test::HasFatalFailure())
                continue;
            SCOPED_TRACE("call " + std::to_string(point.index) + ", number " + std::to_string(point.number) +
                         ", of process " + std::to_string(point.process) +
                         (error == killProcess ? " killed" : std::string(": ") + strerror(error)));
            trial.start();
            const FaultRun disturbed = runWithFault(operation, point, error);
            ++outcomes[trial.outcome(disturbed)];
            // Programs that run side by side come to their calls in another order now and then.
            ++(disturbed.wasStruck ? faults : misses);
        }
    }
    std::cout << trial.name << ": " << faults << (isFull() ? " faults (all)" : " faults") << ", " << misses
              << " runs without";
    for (const auto &[outcome, count] : outcomes)
        std::cout << ", " << outcome << " " << count;
    std::cout << "\n";
    EXPECT_GE(faults, 15);
    return outcomes;
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
    const auto dump = [](const char *name) {
        Json::Value value;
        value["name"] = name;
        for (int i = 0; i < 2000; ++i)  // several pages
            value["filling"].append(i);
        return FW::jsonFileDump(value, STORE + "7.json");
    };
    const auto outcome = [](const FaultRun &run) {
        Json::Value value;
        EXPECT_TRUE(FW::jsonFileLoad(value, STORE + "7.json"));
        EXPECT_EQ(value["filling"].size(), 2000u);
        const std::string name = value["name"].asString();
        EXPECT_TRUE(name == "new" || (name == "old" && run.status != 0)) << name << " after " << run.status;
        return (run.status == 0 ? "succeeded and " : "failed and ") + name;
    };
    run({"dump", [&] { return dump("new"); }, [&] { ASSERT_TRUE(dump("old")); }, outcome});
}

TEST_F(StoreFaults, LeaveTheOldOrTheNewProfileAfterAnEdit) {
    SKIP_UNLESS_TRACEABLE();
    const auto edit = [](const char *port) {
        return FW::VELDFW_PROFILE().profileSet("default", profileOf({portRule(port, FW::FW_POLICY_DENY)}));
    };
    const auto start = [&] {
        removeAll(STORE);
        writeFile(PROFILE, R"({"name": "default"})");
        ASSERT_TRUE(edit("1"));
    };
    const auto outcome = [&](const FaultRun &run) -> std::string {
        FW::FWPROFILE found;
        EXPECT_TRUE(FW::VELDFW_PROFILE().profileGet("default", found));
        const bool isNew = found.rules["eth0"].at(0).portList.at(0) == "2";
        // A profile whose document cannot be read while names are looked up does not exist: then a second document is
        // made, and the first goes on to count.
        const bool isBeside = run.status == 0 && listDirectory(STORE).size() == 2;
        EXPECT_TRUE(isNew || run.status != 0 || isBeside) << run.status;
        EXPECT_TRUE(edit("2"));
        return isBeside          ? "written beside the document that could not be read"
               : run.status == 0 ? "succeeded and new"
               : isNew           ? "failed and new"
                                 : "failed and old";
    };
    run({"edit", [&] { return edit("2"); }, start, outcome});
}

class ReloadFaults : public KernelTest {
protected:
    using Rules = std::pair<std::string, std::string>;

    void SetUp() override {
        KernelTest::SetUp();
        writeFile(STORE + "2.json", R"({"name": "other"})");
        store(profileOf({addressRule("", "10.0.0.1"), addressRule("", "fd00::1", FW::FW_IP_TYPE_V6)}));
        FW::FWPROFILE profile =
            profileOf({portRule("80", FW::FW_POLICY_ALLOW), addressRule("", "fd00::2", FW::FW_IP_TYPE_V6)});
        profile.name = "other";
        ASSERT_TRUE(FW::VELDFW_PROFILE().profileSet("other", profile));
    }

    static void activate(const std::string &name) {
        writeFile(SETTINGS, "{\"profile\": \"" + name + "\", \"status\": true}");
    }

    /// All rules of each family.
    static Rules rules() { return {runChecked({"/sbin/iptables", "-S"}), runChecked({"/sbin/ip6tables", "-S"})}; }

    /// No lock is left, both profiles can be read, and the firewall is switched on with that profile.
    static void expectOrder(const std::string &active) {
        EXPECT_TRUE(execLockIsFree());
        EXPECT_EQ(listDirectory(STORE), (std::vector<std::string>{"1.json", "2.json", "firewall_settings.json"}));
        Json::Value settings;
        EXPECT_TRUE(FW::jsonFileLoad(settings, SETTINGS));
        EXPECT_EQ(settings["profile"].asString(), active);
        EXPECT_TRUE(settings["status"].asBool());
        std::map<std::string, FW::FWPROFILE> profiles;
        EXPECT_TRUE(FW::VELDFW_PROFILE().profileEnum(profiles) && profiles.size() == 2);
    }
};

TEST_P(ReloadFaults, LeaveTheOldOrTheNewRulesAfterAnAtomicReload) {
    SKIP_UNLESS_TRACEABLE();
    const auto reload = [this] { return firewall.fwReloadAtomic(true); };
    const auto applied = [&](const char *name) {
        activate(name);
        EXPECT_TRUE(reload()) << log.text();
        return rules();
    };
    const Rules newRules = applied("other");
    const Rules oldRules = applied("default");
    const auto start = [&] {
        ASSERT_EQ(applied("default"), oldRules) << "the next reload: " << log.text();
        log.clear();
        activate("other");
    };
    const auto outcome = [&](const FaultRun &run) -> std::string {
        const Rules left = rules();
        const bool isKilled = run.status > 1;
        if (isKilled) {
            EXPECT_TRUE(left.first == oldRules.first || left.first == newRules.first) << left.first;
            EXPECT_TRUE(left.second == oldRules.second || left.second == newRules.second) << left.second;
        } else {
            EXPECT_EQ(left, run.status == 0 ? newRules : oldRules) << log.text();
        }
        expectOrder("other");
        return isKilled ? "killed" : run.status == 0 ? "succeeded" : "failed";
    };
    run({"atomic reload", reload, start, outcome, 7, 43});
}

TEST_P(ReloadFaults, ArePutRightByTheNextReloadWhenTheSpecifiedOneIsKilled) {
    SKIP_UNLESS_TRACEABLE();
    const auto reload = [this] { return firewall.fwReload(true); };
    activate("default");
    ASSERT_TRUE(reload()) << log.text();
    const Rules expected = rules();
    const auto start = [&] {
        ASSERT_TRUE(reload()) << log.text();
        ASSERT_EQ(rules(), expected);
    };
    const auto outcome = [&](const FaultRun &run) -> std::string {
        EXPECT_EQ(run.status, run.wasStruck ? 128 + SIGKILL : 0);
        expectOrder("default");
        return rules() == expected ? "killed with all rules" : "killed half-way";
    };
    auto outcomes = run({"specified reload", reload, start, outcome, 20, 0, true});
    EXPECT_GT(outcomes["killed half-way"], 0);
    start();
}

INSTANTIATE_TEST_SUITE_P(Backend, ReloadFaults, testing::Values("nft", "legacy"),
                         [](const auto &entry) { return std::string(entry.param); });

}  // namespace
