// SPDX-License-Identifier: Apache-2.0
// The steps of a trial in the kernel and the store. All of them can be repeated.
#include "system/trialSteps.h"

#include <veld/core.h>
#include <veldfirewall/veldFW.h>

#include <chrono>
#include <csignal>
#include <thread>

#include "frame/errors.h"
#include "system/apply.h"
#include "system/store.h"

namespace veldfwctl {

namespace {

using Clock = std::chrono::steady_clock;

constexpr const char *TRIAL_PREFIX = ".test_";
constexpr const char *EXEC_LOCK = "/tmp/firewall_iptables_exec.lock";
constexpr int EXEC_LOCK_SECONDS = 30;
constexpr std::chrono::seconds STEP_LIMIT{120};  // many thousand rules; only a program that hangs takes longer
constexpr int ATTEMPTS = 5;
constexpr std::chrono::seconds PAUSE{2};

/// A protected call that is ended when it takes too long, with all that it has started.
CallResult limitedCall(const std::function<bool()> &operation) {
    const auto start = Clock::now();
    return protectedCall(operation, [start](int process) {
        if (Clock::now() - start > STEP_LIMIT) {
            kill(-process, SIGKILL);
        }
    });
}

Json::Value switchedTo(bool enabled) {
    Json::Value change;
    change["status"] = enabled;
    return change;
}

bool isEnabled() {
    bool enabled = false;
    return FW::VELDFW().fwStatus(enabled) && enabled;
}

/// The active profile, by the surest way first: the last one switches the firewall off if it fails too.
bool activeProfileApply(const Json::Value &commands) {
    FW::VELDFW firewall;
    FW::FwApplyFailure failure;
    const bool enabled = isEnabled();
    return (enabled && firewall.fwReloadAtomic(true, failure)) ||
           (!commands.isNull() && firewall.fwExecAtomic(commands)) || (enabled && firewall.fwReload(true));
}

}  // namespace

TrialReturn trialPrepare(const std::string &profile) {
    const FW::FWPROFILE tried = profileRead(profile);
    const Settings settings = settingsRead();
    TrialReturn before{settings.profile, settings.enabled, {}};
    if (settings.enabled) {
        if (settings.profile == profile) {
            throw UsageError("Profile \"" + profile +
                             "\" is the active one, so there would be nothing to go back to; copy it with \"veldfwctl "
                             "profile copy\", change the copy and try that");
        }
        require("Cannot prepare the way back to profile \"" + settings.profile + "\"", "nothing was changed",
                [&] { return FW::VELDFW().fwIptablesRulesEnum(settings.profile, before.commands, true); });
    }
    // Its file may have to be created; later there may be no room for that.
    int lock = -1;
    if (VLIBCFileLockTimeByFile(EXEC_LOCK, 1, EXEC_LOCK_SECONDS, &lock) != 1) {
        throw Failure(std::string("Cannot get the lock ") + EXEC_LOCK +
                      "; nothing was changed: \"veldfwctl doctor\" tells who holds it");
    }
    VLIBCFileUnlockByFile(lock);
    try {
        require("Cannot store the trial copy of profile \"" + profile + "\"", "nothing was changed",
                [&] { return FW::VELDFW_PROFILE().CreateTestProfile(profile, tried); });
    } catch (const Failure &) {
        // On a full disk a part of it can have been written.
        libraryCall([&profile] { return FW::VELDFW_PROFILE().RemoveTestProfile(profile); });
        throw;
    }
    return before;
}

CallResult trialForget(const TrialRecord &record) {
    return limitedCall([&record] { return FW::VELDFW_PROFILE().RemoveTestProfile(record.profile); });
}

CallResult trialApply(const TrialRecord &record, const std::string &client) {
    return limitedCall([&] {
        FW::VELDFW firewall;
        if (!record.atomic) {
            return firewall.TestApplyingProfile(record.profile, client);
        }
        Json::Value commands;
        const std::string copy = TRIAL_PREFIX + record.profile;
        const bool built = client.empty() ? firewall.fwIptablesRulesEnum(copy, commands, false)
                                          : firewall.fwIptablesRulesEnum(copy, commands, client);
        return built && firewall.fwExecAtomic(commands);
    });
}

CallResult trialTakeBack(const TrialRecord &record, const TrialReturn &before, bool applied) {
    bool turnOn = before.wasEnabled;
    if (applied) {
        // Somebody may have switched the firewall on or off meanwhile. A trial that failed has switched it off itself.
        libraryCall([&turnOn] { return FW::VELDFW().fwStatus(turnOn); });
    }
    CallResult result;
    for (int attempt = 0; attempt < ATTEMPTS && !result.succeeded; ++attempt) {
        if (attempt > 0) {
            std::this_thread::sleep_for(PAUSE);
        }
        result = limitedCall([&] {
            FW::VELDFW firewall;
            if (turnOn && !isEnabled()) {
                firewall.configSet(switchedTo(true));
            }
            const bool restored = turnOn ? activeProfileApply(before.commands) : firewall.fwClear();
            // What was killed half-way has left the built-in chains at DROP.
            return (record.atomic || firewall.fwDefaultAccept()) && restored;
        });
    }
    if (result.succeeded) {
        result.messages = trialForget(record).messages;
    }
    return result;
}

CallResult trialAdopt(const TrialRecord &record) {
    return limitedCall([&record] {
        return FW::VELDFW_PROFILE().AdoptTestProfile(record.profile) &&
               FW::VELDFW().fwProfileConfigSet(record.profile, false);
    });
}

CallResult trialEnforce(const TrialRecord &record) {
    CallResult result = limitedCall([&record] {
        FW::VELDFW firewall;
        if (isEnabled()) {
            return record.atomic ? firewall.fwReloadAtomic(true) : firewall.fwReload(true);
        }
        FW::FwApplyFailure failure;
        return record.atomic ? enableAtomic(failure) : firewall.fwEnable();
    });
    if (result.succeeded) {
        trialForget(record);
    } else {
        limitedCall([&record] { return FW::VELDFW().fwProfileConfigSet(record.previous, false); });
    }
    return result;
}

}  // namespace veldfwctl
