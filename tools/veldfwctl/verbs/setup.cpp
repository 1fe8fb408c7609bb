// SPDX-License-Identifier: Apache-2.0
// "setup": creates what the firewall needs of the system, as far as it is missing.
#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <iterator>

#include "frame/verb.h"
#include "model/chainSetup.h"
#include "system/newFile.h"
#include "system/program.h"
#include "system/store.h"

namespace veldfwctl {

namespace {

namespace fs = std::filesystem;

constexpr const char *PROFILES = "/usr/veld/etc/firewall.d";
constexpr const char *SHIPPED_PROFILES = "/usr/veld/etc.defaults/firewall.d";
constexpr const char *SETTINGS = "firewall_settings.json";

enum class Outcome { DONE, PRESENT, FAILED };

struct Item {
    std::string name;
    Outcome outcome;
    std::string text;  ///< what was done, or why it failed and what to do
};

bool isDocument(const fs::path &path) {
    return path.extension() == ".json" && path.filename() != SETTINGS;
}

std::vector<fs::path> documentsIn(const std::string &directory) {
    std::vector<fs::path> paths;
    std::error_code error;
    for (fs::directory_iterator entry(directory, error), end; !error && entry != end; entry.increment(error)) {
        if (isDocument(entry->path())) {
            paths.push_back(entry->path());
        }
    }
    return paths;
}

Item directorySetUp(const char *path, mode_t mode) {
    const std::string name = std::string("directory ") + path;
    struct stat status = {};
    if (stat(path, &status) == 0) {
        return S_ISDIR(status.st_mode) ? Item{name, Outcome::PRESENT, ""}
                                       : Item{name, Outcome::FAILED, "is no directory; move it away"};
    }
    std::error_code error;
    fs::create_directories(path, error);
    if (!error) {
        fs::permissions(path, static_cast<fs::perms>(mode), error);
    }
    if (error) {
        return {name, Outcome::FAILED, error.message() + "; run this as root, on a writable system"};
    }
    return {name, Outcome::DONE, "created"};
}

Item profilesSetUp() {
    const std::string name = std::string("profiles in ") + PROFILES;
    if (!documentsIn(PROFILES).empty()) {
        return {name, Outcome::PRESENT, ""};
    }
    const std::vector<fs::path> shipped = documentsIn(SHIPPED_PROFILES);
    if (shipped.empty()) {
        return {name, Outcome::FAILED,
                std::string("none, and none to copy in ") + SHIPPED_PROFILES + "; install veldfirewall-common"};
    }
    try {
        for (const fs::path &path : shipped) {
            std::ifstream file(path);
            const std::string text{std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
            if (file.bad() || text.empty()) {
                return {name, Outcome::FAILED, "Cannot read " + path.string() + "; install veldfirewall-common again"};
            }
            fileReplace(PROFILES / path.filename(), text);
        }
    } catch (const Failure &failure) {
        return {name, Outcome::FAILED, failure.what()};
    }
    return {name, Outcome::DONE, "copied from " + std::string(SHIPPED_PROFILES)};
}

Item settingsSetUp() {
    const std::string path = std::string(PROFILES) + "/" + SETTINGS;
    const bool existed = fs::exists(path);
    try {
        profileChosen("");  // reading the settings creates them
    } catch (const std::exception &failure) {
        return {"settings", Outcome::FAILED, failure.what()};
    }
    if (!fs::exists(path)) {
        return {"settings", Outcome::FAILED, "Cannot write " + path + "; run this as root, on a writable system"};
    }
    return existed ? Item{"settings", Outcome::PRESENT, ""} : Item{"settings", Outcome::DONE, "created: off"};
}

/// What packages bring along; copies from elsewhere would hide that one is missing.
Item shippedCheck(const char *path) {
    std::error_code error;
    const bool present = fs::is_directory(path, error) ? !fs::is_empty(path, error) : fs::exists(path, error);
    return present ? Item{path, Outcome::PRESENT, ""}
                   : Item{path, Outcome::FAILED, "missing; install veldfirewall-common"};
}

void chainsSetUp(const std::string &family, const std::string &program, std::vector<Item> &items) {
    const ProgramOutput listing = programRun({program, "-w", "-S"});
    if (!listing.succeeded()) {
        items.push_back(
            {family + " chains", Outcome::FAILED, program + " -S: " + listing.reason() + "; run \"veldfwctl doctor\""});
        return;
    }
    const ChainPlan plan = chainPlanMake(listing.output);
    const std::string restore = program + "-restore";
    const ProgramOutput mended =
        plan.restoreInput.empty() ? ProgramOutput() : programRun({restore, "--noflush", "-w"}, plan.restoreInput);
    for (const ChainItem &item : plan.items) {
        const std::string name = family + " " + item.name;
        if (item.lack.empty()) {
            items.push_back({name, Outcome::PRESENT, ""});
        } else if (mended.succeeded()) {
            items.push_back(
                {name, Outcome::DONE, item.lack == "missing" ? "created" : "was " + item.lack + ", mended"});
        } else {
            items.push_back({name, Outcome::FAILED,
                             item.lack + "; " + restore + ": " + mended.reason() + "; run \"veldfwctl doctor\""});
        }
    }
}

int setup(const Context &context) {
    std::vector<Item> items = {
        directorySetUp(PROFILES, 0755),
        directorySetUp("/usr/veld/etc/services.d", 0755),
        directorySetUp("/var/lock/firewall", 0770),
        directorySetUp("/run/veld", 0700),
        shippedCheck("/usr/veld/etc/services.d"),
        shippedCheck("/usr/veld/etc.defaults/iptables_modules_list"),
        profilesSetUp(),
        settingsSetUp(),
    };
    chainsSetUp("IPv4", IPTABLES, items);
    chainsSetUp("IPv6", IP6TABLES, items);
    Table table{{"ITEM", "STATE", ""}, {}};
    Json::Value json(Json::arrayValue);
    size_t failed = 0;
    for (const Item &item : items) {
        const bool isFailed = item.outcome == Outcome::FAILED;
        failed += isFailed ? 1 : 0;
        const char *state = isFailed ? "failed" : item.outcome == Outcome::DONE ? "done" : "already there";
        table.rows.push_back({item.name, {state, isFailed ? Shade::BAD : Shade::GOOD}, item.text});
        Json::Value entry;
        entry["item"] = item.name;
        entry["state"] = state;
        entry["text"] = item.text;
        json.append(entry);
    }
    if (context.json) {
        context.printJson(json);
    } else {
        context.printTable(table);
    }
    if (failed > 0) {
        throw Failure(std::to_string(failed) + " of " + std::to_string(items.size()) +
                      " items could not be set up; the list says why");
    }
    return STATUS_DONE;
}

}  // namespace

void registerSetup(CLI::App &app, Context &context) {
    verbAdd(app, context,
            {"setup", "Create what the firewall needs of this machine", "veldfwctl setup",
             [&context] { return setup(context); }, false,
             "Creates directories, the shipped profile where there is none, the settings (off), the chains "
             "INPUT_FIREWALL and FORWARD_FIREWALL and the jumps to them, each where it is missing. The jumps are put "
             "in front of all other rules of INPUT and FORWARD, and surplus ones are removed, in one transaction per "
             "family. Nothing is switched on."});
}

}  // namespace veldfwctl
