// SPDX-License-Identifier: Apache-2.0
// Applying a command list as a whole: everything new, or everything as it was.
#include <unistd.h>

#include <algorithm>
#include <memory>
#include <optional>
#include <utility>

#include "fw/commandList.h"
#include "fw/commandOrigin.h"
#include "fw/execLock.h"
#include "fw/firewallModules.h"
#include "fw/programRun.h"
#include "fw/restoreInput.h"
#include "utils/log.h"
#include "veldfirewall/fwIptables.h"
#include "veldfirewall/veldFW.h"

namespace FW {

namespace {

constexpr const char *SCRATCH_NETWORK_PROGRAM = "/usr/bin/unshare";

/// Has a program of the legacy backend lock its own input, which nobody else can open, instead of the one file that
/// all of them lock. Enough for a trial: it changes nothing, and the kernel gives it each table as of one moment.
constexpr const char *LOCK_OF_ITS_OWN = "XTABLES_LOCKFILE=/proc/self/fd/0";

/// Null, for the common lock, where there is no /proc.
const char *trialLock() {
    return access("/proc/self/fd/0", F_OK) == 0 ? LOCK_OF_ITS_OWN : nullptr;
}

constexpr const char *WAIT_FOR_LOCK = "--wait=10";
constexpr const char *WAIT_LONG_FOR_LOCK = "--wait=60";  // where giving up leaves the rules half old, half new

/// One family's half of an atomic apply.
class FamilyApply {
public:
    /// Starts to list the rules in force, while the caller makes those to come.
    FamilyApply(const char *familyName, const char *programName)
        : family(familyName), program(programName),
          filterListing(std::make_unique<StartedProgram>(ProgramCall{saveCommand(FILTER_TABLE), ""})) {}

    const std::string &familyName() const { return family; }

    /// Writes the input, and starts what shows whether commit() can succeed and be undone: a run that reads everything
    /// and commits nothing, and the lists of the rules in force in other tables. None changes anything.
    /// @return false, with the failure told, when a command cannot be part of a transaction
    bool trialStart(std::vector<ListedCommand> listed, FwApplyFailure &failure) {
        commands = std::move(listed);
        const std::optional<RestoreRefusal> refusal = restoreInputWrite(commands, input);
        if (refusal) {
            commandTell(refusal->command, refusal->reason, failure);
            return false;
        }
        trial = std::make_unique<StartedProgram>(ProgramCall{restoreCommand({"--test"}), input.text, trialLock()});
        listings = listingsStart(1);
        return true;
    }

    /// Waits for that, and keeps what undo() puts back.
    bool trialSucceeds(FwApplyFailure &failure) {
        const ProgramRun tried = trial->wait();
        std::string message;
        listingRead(*filterListing, snapshot, message);
        listingsRead(listings, snapshot, message);
        if (!message.empty()) {
            failure.family = family;
            failure.message = message;
        } else if (savedRulesHoldLineBreak(snapshot)) {
            failure.family = family;
            failure.message = "a rule in force holds a line break and could not be put back";
        }
        return failure.message.empty() && restored(tried, failure);
    }

    bool commit(FwApplyFailure &failure) const {
        return restored(programRun({restoreCommand({}), input.text}), failure);
    }

    /// Puts back what commit() changed, all or some of it.
    /// @return false when that failed, which is logged: there is nothing left to go back to
    bool undo() const {
        std::string now;
        std::string message;
        listingsRead(listingsStart(0), now, message);
        if (!message.empty()) {
            FW_LOG_ERR("Failed to list the rules of %s: %s", program.c_str(), message.c_str());
        }
        const std::string text = restoreInputOfUndo(input, snapshot, now);
        if (text.empty()) {
            return message.empty();
        }
        const ProgramRun undone = programRun({restoreCommand({"--counters"}, WAIT_LONG_FOR_LOCK), text});
        if (!undone.succeeded) {
            FW_LOG_ERR("Failed to put the old rules of %s back: %s", program.c_str(), undone.message.c_str());
        }
        return undone.succeeded;
    }

private:
    std::string family;
    std::string program;
    std::vector<ListedCommand> commands;
    RestoreInput input;
    std::unique_ptr<StartedProgram> filterListing;
    std::unique_ptr<StartedProgram> trial;
    std::vector<std::unique_ptr<StartedProgram>> listings;  ///< of the other tables
    std::string snapshot;

    std::vector<std::string> restoreCommand(const std::vector<std::string> &options,
                                            const char *wait = WAIT_FOR_LOCK) const {
        // Without --wait the legacy program waits for another holder of the tables' lock for ever.
        std::vector<std::string> command = {program + "-restore", "--noflush", wait};
        command.insert(command.end(), options.begin(), options.end());
        return command;
    }

    std::vector<std::string> saveCommand(const std::string &table) const {
        return {program + "-save", "--counters", "--table", table};
    }

    /// Lists the rules in force in the tables of the input, from the `first` on.
    std::vector<std::unique_ptr<StartedProgram>> listingsStart(size_t first) const {
        std::vector<std::unique_ptr<StartedProgram>> started;
        for (size_t table = first; table < input.tables.size(); ++table) {
            started.push_back(std::make_unique<StartedProgram>(ProgramCall{saveCommand(input.tables[table]), ""}));
        }
        return started;
    }

    /// Adds what a listing prints to `saved`, or, unless there is one, to `message` why there is nothing.
    void listingRead(StartedProgram &listing, std::string &saved, std::string &message) const {
        const ProgramRun run = listing.wait();
        if (!run.succeeded && message.empty()) {
            message = program + "-save: " + run.message;
        }
        saved += run.output;
    }

    void listingsRead(const std::vector<std::unique_ptr<StartedProgram>> &started, std::string &saved,
                      std::string &message) const {
        for (const std::unique_ptr<StartedProgram> &listing : started) {
            listingRead(*listing, saved, message);
        }
    }

    bool restored(const ProgramRun &run, FwApplyFailure &failure) const {
        if (run.succeeded) {
            return true;
        }
        const size_t line = restoreFailedLine(run.message);
        const size_t culprit = culpritFind(line);
        if (culprit != RestoreInput::NO_COMMAND) {
            commandTell(culprit, run.message, failure);
        } else {
            failure.family = family;
            failure.message = program + "-restore: " + (line > 0 ? input.line(line) + ": " : "") + run.message;
        }
        return false;
    }

    /// The command of the line that the program blames, or, where it blames only the end of a table, the first command
    /// that a network namespace of its own refuses as well.
    size_t culpritFind(size_t line) const {
        if (line == 0 || line > input.commandOfLine.size()) {
            return RestoreInput::NO_COMMAND;
        }
        if (input.commandOfLine[line - 1] != RestoreInput::NO_COMMAND || input.line(line) != "COMMIT") {
            return input.commandOfLine[line - 1];
        }
        const auto isRefused = [this](size_t lines) {
            std::vector<std::string> command = restoreCommand({});
            command.insert(command.begin(), {SCRATCH_NETWORK_PROGRAM, "--net"});
            return !programRun({command, restoreInputOfTrial(input, snapshot, lines)}).succeeded;
        };
        size_t accepted = 0;
        size_t refused = line;
        if (isRefused(accepted) || !isRefused(refused)) {
            return RestoreInput::NO_COMMAND;
        }
        while (refused - accepted > 1) {
            const size_t middle = accepted + (refused - accepted) / 2;
            (isRefused(middle) ? refused : accepted) = middle;
        }
        return input.commandOfLine[refused - 1];
    }

    void commandTell(size_t index, const std::string &message, FwApplyFailure &failure) const {
        failure.family = family;
        failure.adapter = commands[index].group;
        failure.command = commands[index].commandLine;
        failure.message = message;
    }
};

/// Both families, up to the commits of both or of none.
bool allOrNothing(std::vector<FamilyApply> &families, FwApplyFailure &failure) {
    for (FamilyApply &family : families) {
        if (!family.trialSucceeds(failure)) {
            return false;
        }
    }
    for (size_t i = 0; i < families.size(); ++i) {
        if (families[i].commit(failure)) {
            continue;
        }
        // This one too: its tables are committed one by one, and it may have died after a commit.
        for (size_t changed = i + 1; changed > 0; --changed) {
            if (!families[changed - 1].undo()) {
                failure.message +=
                    "; the old rules of " + families[changed - 1].familyName() + " could not be put back";
            }
        }
        return false;
    }
    return true;
}

/// The families that a command list can have commands for, with the programs that they are for.
constexpr std::pair<const char *, const char *> FAMILY_PROGRAMS[] = {{FAMILY_V4, IPTABLES_PROGRAM},
                                                                     {FAMILY_V6, IP6TABLES_PROGRAM}};

/// @param families all that the list has commands for; others are left alone
bool commandListApply(const Json::Value &commandList, std::vector<FamilyApply> families, FwApplyFailure &failure) {
    const std::vector<ListedCommand> commands = commandsInOrder(commandList);
    families.erase(
        std::remove_if(families.begin(), families.end(),
                       [&](const FamilyApply &family) { return !commandList.isMember(family.familyName()); }),
        families.end());
    // Side by side: each program spends its time reading or printing rules, on one processor.
    for (FamilyApply &family : families) {
        std::vector<ListedCommand> ofFamily;
        std::copy_if(commands.begin(), commands.end(), std::back_inserter(ofFamily),
                     [&family](const ListedCommand &command) { return command.family == family.familyName(); });
        if (!family.trialStart(std::move(ofFamily), failure)) {
            return false;
        }
    }
    return allOrNothing(families, failure);
}

void failureLog(const FwApplyFailure &failure) {
    std::string text = "Failed to apply the rules, the old ones stay in force";
    text += failure.profile.empty() ? "" : ": profile " + failure.profile;
    text += failure.adapter.empty() ? "" : ": adapter " + failure.adapter;
    if (failure.rulePosition >= 0) {
        text += ": rule " + std::to_string(failure.rulePosition) + " \"" + failure.ruleName + "\"";
    }
    text += failure.family.empty() ? "" : ": " + failure.family;
    text += failure.command.empty() ? "" : ": \"" + failure.command + "\"";
    FW_LOG_ERR("%s: %s", text.c_str(), failure.message.c_str());
}

/// Adds to the failure which rule of the profile the command comes from.
void originTell(const FWPROFILE &profile, FwApplyFailure &failure) {
    CommandOrigin origin;
    const size_t arguments = failure.command.find(' ') + 1;
    if (!failure.command.empty() &&
        commandOriginFind(profile, failure.family, failure.command.substr(arguments), origin)) {
        failure.adapter = origin.adapter;
        failure.rulePosition = origin.rulePosition;
        failure.ruleName = origin.ruleName;
    }
}

}  // namespace

bool VELDFW::fwExecAtomic(const Json::Value &commandList, FwApplyFailure &failure) {
    FwApplyFailure found;
    std::vector<FamilyApply> families;
    for (const auto &[family, program] : FAMILY_PROGRAMS) {
        if (commandList.isMember(family)) {
            families.emplace_back(family, program);
        }
    }
    if (commandListApply(commandList, std::move(families), found)) {
        return true;
    }
    failureLog(found);
    failure = found;
    return false;
}

bool VELDFW::fwExecAtomic(const Json::Value &commandList) {
    FwApplyFailure failure;
    return fwExecAtomic(commandList, failure);
}

bool VELDFW::fwReloadAtomic(bool keepEstablished, FwApplyFailure &failure) {
    FwApplyFailure found;
    const ExecLock lock;
    if (!lock.isTaken()) {
        FW_LOG_ERR("TIMEOUT: getting lock");
        found.message = "another process holds the lock of the kernel's rules";
        failure = found;
        return false;
    }
    const auto fail = [&](const char *message) {
        FW_LOG_ERR("%s", message);
        found.message = message;
        failure = found;
        return false;
    };
    bool enabled = false;
    if (!fwStatus(enabled)) {
        return fail("Failed to check status");
    }
    if (!enabled) {
        return true;
    }
    if (!firewallModLoad()) {
        return fail("Failed to firewallModLoad()");
    }
    if (!fwProfileConfigGet(found.profile)) {
        return fail("Failed to fwProfileConfigGet()");
    }
    std::vector<FamilyApply> families;  // already now: reading the profile and listing the old rules take as long
    for (const auto &[family, program] : FAMILY_PROGRAMS) {
        families.emplace_back(family, program);
    }
    FWPROFILE profile;
    if (!VELDFW_PROFILE().profileGet(found.profile, profile)) {
        return fail("Failed to profileGet()");
    }
    // Asked first: without the interfaces the translator leaves out their rules, and that is not the profile.
    VELDFW_IPTABLES_RULES translator;
    if (!translator.enabledAdapterEnum()) {
        return fail("Failed to enabledAdapterEnum()");
    }
    Json::Value commands;
    if (!translator.fwRulesToIptablesRules(keepEstablished, profile.rules, profile.adapterPolicyMap, commands)) {
        return fail("Failed to fwRulesToIptablesRules()");
    }
    if (!commandListApply(commands, std::move(families), found)) {
        originTell(profile, found);
        failureLog(found);
        failure = found;
        return false;
    }
    return true;
}

bool VELDFW::fwReloadAtomic(bool keepEstablished) {
    FwApplyFailure failure;
    return fwReloadAtomic(keepEstablished, failure);
}

}  // namespace FW
