// SPDX-License-Identifier: Apache-2.0
// Puts the active profile into the kernel, with progress on a terminal and a full account of a failure.
#include "system/apply.h"

#include <sys/ioctl.h>
#include <unistd.h>
#include <veldfirewall/fwHook.h>

#include <algorithm>
#include <chrono>
#include <fstream>
#include <iostream>
#include <iterator>
#include <optional>

#include "frame/errors.h"
#include "frame/libraryCall.h"
#include "model/applyFailure.h"
#include "model/commandOrigin.h"
#include "model/progressText.h"
#include "system/store.h"

namespace veldfwctl {

namespace {

using Clock = std::chrono::steady_clock;

constexpr std::chrono::seconds PATIENCE{1};

std::string fileText(const std::string &path) {
    std::ifstream file(path);
    return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
}

/// The command line of the program that a process is running just now; empty when it runs none.
std::string childCommand(int process) {
    const std::string id = std::to_string(process);
    const std::string children = fileText("/proc/" + id + "/task/" + id + "/children");
    const std::string child = children.substr(0, children.find(' '));
    std::string command = child.empty() ? "" : fileText("/proc/" + child + "/cmdline");
    if (!command.empty() && command.back() == '\0') {
        command.pop_back();
    }
    std::replace(command.begin(), command.end(), '\0', ' ');
    return command;
}

/// Shows on a terminal which of the planned commands is running, once that takes long.
class Progress {
public:
    Progress(const Context &context, const Application &application) : m_what(application.doing) {
        m_isShown = context.errorIsTerminal && !context.json;
        if (m_isShown && !application.profile.empty()) {
            Json::Value commands;
            libraryCall([&] { return FW::VELDFW().fwIptablesRulesEnum(application.profile, commands, true); });
            m_commands = commandsInOrder(commands);
        }
    }
    ~Progress() {
        if (m_hasLine) {
            std::cerr << "\r\033[K" << std::flush;
        }
    }
    Progress(const Progress &) = delete;
    Progress &operator=(const Progress &) = delete;

    void update(int process) {
        if (!m_isShown) {
            return;
        }
        m_done = commandsDone(m_commands, m_done, childCommand(process));
        const auto elapsed = Clock::now() - m_start;
        if (elapsed < PATIENCE) {
            return;
        }
        winsize size = {};
        ioctl(STDERR_FILENO, TIOCGWINSZ, &size);
        const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(elapsed).count();
        std::cerr << '\r'
                  << progressLine(m_what, m_done, m_commands.size(), static_cast<int>(seconds),
                                  size.ws_col > 0 ? size.ws_col : 80)
                  << "\033[K" << std::flush;
        m_hasLine = true;
    }

private:
    std::string m_what;
    std::vector<std::string> m_commands;
    size_t m_done = 0;
    Clock::time_point m_start = Clock::now();
    bool m_isShown = false;
    bool m_hasLine = false;
};

/// The switch as it is after a failure, in words.
std::string aftermath() {
    bool enabled = false;
    const CallResult result = libraryCall([&enabled] { return FW::VELDFW().fwStatus(enabled); });
    if (!result.succeeded) {
        return "whether the firewall is on cannot be read";
    }
    return enabled ? "the firewall is still marked as on" : "the firewall is off";
}

[[noreturn]] void failureReport(const Context &context, const Application &application,
                                const std::vector<std::string> &messages) {
    const FailedCommand failed = failedCommandFind(messages);
    const std::string state = aftermath();
    std::optional<RuleCommands> origin;
    if (!application.profile.empty() && !failed.command.empty()) {
        FW::FWPROFILE profile;
        std::vector<RuleCommands> rules;
        libraryCall([&] {
            const bool isRead = FW::VELDFW_PROFILE().profileGet(application.profile, profile);
            rules = ruleCommandsBuild(profile);
            return isRead;
        });
        origin = commandOrigin(rules, failed.command);
    }
    if (context.json) {
        Json::Value json;
        json["applied"] = false;
        json["profile"] = application.profile;
        if (origin) {
            json["adapter"] = origin->adapter;
            json["rule"] = static_cast<Json::UInt64>(origin->number);
            json["name"] = origin->name;
        }
        json["command"] = failed.command;
        json["said"] = failed.said;
        json["log"] = Json::arrayValue;
        for (const std::string &message : messages) {
            json["log"].append(message);
        }
        context.printJson(json);
    }
    if (failed.command.empty()) {
        throw Failure(application.failure + ": " + messagesJoin(messages) + "; " + state +
                      "; run \"veldfwctl doctor\"");
    }
    throw Failure(application.failure + ": " + (origin ? originText(*origin) + ": " : "") + "\"" + failed.command +
                  "\" failed: " + (failed.said.empty() ? messagesJoin(failed.rest) : failed.said) + "; " + state +
                  (origin ? "; mend or disable that rule, then run \"veldfwctl enable\""
                          : "; run \"veldfwctl doctor\" to see whether this machine can run the firewall"));
}

}  // namespace

std::string heldUpText(std::chrono::milliseconds time) {
    if (time.count() == 0) {
        return "New traffic was not held up.";
    }
    // Rounded up: the time between the policies DROP and ACCEPT lies somewhere inside.
    const auto tenths = (time.count() + 99) / 100;
    return "New traffic was held up for at most " + std::to_string(tenths / 10) + "." + std::to_string(tenths % 10) +
           " s.";
}

std::chrono::milliseconds applicationApply(const Context &context, const Application &application) {
    CallResult result;
    const auto start = Clock::now();
    {
        Progress progress(context, application);
        result = protectedCall(application.operate, [&progress](int process) { progress.update(process); });
    }
    if (!result.succeeded) {
        failureReport(context, application, result.messages);
    }
    const auto heldUp = application.atomic ? std::chrono::milliseconds(0)
                                           : std::chrono::ceil<std::chrono::milliseconds>(Clock::now() - start);
    if (!application.profile.empty()) {
        context.print(heldUpText(heldUp));
    }
    return heldUp;
}

bool enableAtomic(FW::FwApplyFailure &failure) {
    FW::VELDFW firewall;
    bool before = false;
    if (!firewall.fwStatus(before)) {
        return false;
    }
    const auto switchTo = [&firewall](bool enabled) {
        Json::Value change;
        change["status"] = enabled;
        return firewall.configSet(change);
    };
    FW::VeldFwHook hook;  // it logs its failures, which do not stop the switch
    hook.RunFwEnablePreHook();
    const bool succeeded = switchTo(true) && firewall.fwReloadAtomic(true, failure);
    if (!succeeded && !before) {
        switchTo(false);
    }
    hook.RunFwEnablePostHook(succeeded);
    return succeeded;
}

bool reloadRun(const Context &context, bool atomic, std::chrono::milliseconds *heldUp) {
    const Settings settings = settingsRead();
    if (settings.enabled) {
        const auto time = applicationApply(
            context,
            {"Applying profile \"" + settings.profile + "\"", "Cannot apply profile \"" + settings.profile + "\"",
             settings.profile,
             [atomic] { return atomic ? FW::VELDFW().fwReloadAtomic(true) : FW::VELDFW().fwReload(true); }, atomic});
        if (heldUp != nullptr) {
            *heldUp = time;
        }
    }
    return settings.enabled;
}

bool changeApply(const Context &context, const std::string &profile, bool apply) {
    const Settings settings = settingsRead();
    if (settings.profile != profile) {
        if (apply) {
            context.warn("profile \"" + profile + "\" is not the active one; \"veldfwctl profile use\" makes it so");
        }
        return false;
    }
    if (apply) {
        if (!reloadRun(context)) {
            context.warn("the firewall is off; \"veldfwctl enable\" switches it on");
        }
        return settings.enabled;
    }
    if (settings.enabled) {
        context.warn("profile \"" + profile + "\" is in force without this change; run \"veldfwctl reload\"");
    }
    return false;
}

}  // namespace veldfwctl
