// SPDX-License-Identifier: Apache-2.0
// "try": puts a profile into force for a while; what was before comes back unless somebody confirms.
#include <chrono>
#include <cstdlib>
#include <ctime>
#include <memory>

#include "frame/verb.h"
#include "model/addresses.h"
#include "system/apply.h"
#include "system/trialPlace.h"
#include "system/trialWatch.h"

namespace veldfwctl {

namespace {

constexpr int SHORTEST = 1;
constexpr int LONGEST = 86400;

struct Options {
    std::string profile;
    int seconds = 60;
    std::string client;
    bool atomic = false;
    bool confirm = false;
    bool revert = false;
    bool status = false;
};

/// Where the person at the keyboard is connected from.
std::string clientOfSession() {
    const char *connection = std::getenv("SSH_CONNECTION");
    const std::string text = connection != nullptr ? connection : "";
    const std::string address = text.substr(0, text.find(' '));
    return addressFromText(address) ? address : "";
}

int statusShow(const Context &context) {
    const std::optional<TrialRecord> record = trialRecordRead();
    const bool isUnderWay = record && isOpen(record->phase);
    // Not by the lock alone: holding it, if only to look, could make a trial that begins just now fail.
    const bool hasWatch =
        isUnderWay && (trialSocketConnect().isOpen() || (record->watch == 0 && !trialLockTake().isOpen()));
    const int64_t left = isUnderWay ? std::max<int64_t>(0, record->until - std::time(nullptr)) : 0;
    if (context.json) {
        Json::Value json;
        json["trial"] = isUnderWay;
        if (record) {
            json["profile"] = record->profile;
            json["previous"] = record->previous;
            json["wasEnabled"] = record->wasEnabled;
            json["phase"] = isUnderWay && !hasWatch ? "abandoned" : trialPhaseText(record->phase);
            json["secondsLeft"] = static_cast<Json::Int64>(left);
            json["watch"] = hasWatch ? record->watch : 0;
            json["text"] = record->text;
        }
        context.printJson(json);
    } else if (!isUnderWay) {
        context.print("There is no trial." + (record ? " The last one: " + record->text : ""));
    } else if (!hasWatch) {
        context.print("Profile \"" + record->profile +
                      "\" is on trial, but the watch is gone; run \"veldfwctl try --revert\".");
    } else if (record->phase == TrialPhase::APPLYING) {
        context.print("Profile \"" + record->profile + "\" is being applied for a trial.");
    } else {
        context.print("Profile \"" + record->profile + "\" is on trial for another " + std::to_string(left) +
                      " seconds (watch: process " + std::to_string(record->watch) + ").");
    }
    return isUnderWay ? STATUS_DONE : STATUS_NO;
}

int start(const Context &context, const Options &options) {
    const std::string client = options.client.empty() ? clientOfSession() : options.client;
    if (!client.empty() && !addressFromText(client)) {
        throw UsageError("\"" + client + "\" is no address; --client takes one such as 192.0.2.7");
    }
    const auto heldUp = trialStart({options.profile, client, options.seconds, options.atomic});
    context.print(heldUpText(heldUp));
    context.print("Profile \"" + options.profile + "\" is in force for " + std::to_string(options.seconds) +
                  " seconds. Open a new connection to see that you still get in, then run \"veldfwctl try --confirm\"; "
                  "otherwise what was before comes back by itself.");
    if (context.json) {
        Json::Value json;
        json["trial"] = true;
        json["profile"] = options.profile;
        json["client"] = client;
        json["seconds"] = options.seconds;
        json["heldUpMilliseconds"] = static_cast<Json::Int64>(heldUp.count());
        context.printJson(json);
    }
    return STATUS_DONE;
}

int run(const Context &context, const Options &options) {
    const int actions = (options.profile.empty() ? 0 : 1) + (options.confirm ? 1 : 0) + (options.revert ? 1 : 0) +
                        (options.status ? 1 : 0);
    if (actions != 1) {
        throw UsageError("Name a profile to try, or give one of --confirm, --revert and --status");
    }
    if (options.status) {
        return statusShow(context);
    }
    if (!options.profile.empty()) {
        return start(context, options);
    }
    const std::string text = trialEnd(options.confirm);
    context.print(text);
    if (context.json) {
        Json::Value json;
        json["trial"] = false;
        json["kept"] = options.confirm;
        json["text"] = text;
        context.printJson(json);
    }
    return STATUS_DONE;
}

}  // namespace

void registerTry(CLI::App &app, Context &context) {
    const auto options = std::make_shared<Options>();
    CLI::App *verb = verbAdd(
        app, context,
        {"try", "Put a profile into force for a while, and take it back unless that is confirmed",
         "veldfwctl try office --timeout 60\nveldfwctl try --confirm",
         [&context, options] { return run(context, *options); }, false,
         "A process of its own watches over the trial. It puts back what was before when nobody confirms in time, even "
         "if the connection breaks, the terminal is closed or this program is killed, and needs no room on a disk for "
         "that. Confirming makes the profile the active one and switches the firewall on if it was off. Established "
         "connections from the client's address must be let in by the profile's own rules; without a client, those of "
         "everybody. Other trials, reloads and switching end a trial too."});
    verb->add_option("profile", options->profile, "Profile to try");
    verb->add_option("-t,--timeout", options->seconds, "Seconds until it is taken back")
        ->check(CLI::Range(SHORTEST, LONGEST))
        ->capture_default_str();
    verb->add_option("-c,--client", options->client,
                     "Address from which you are connected; by default that of the SSH connection");
    verb->add_flag("--atomic", options->atomic, ATOMIC_HELP);
    verb->add_flag("--confirm", options->confirm, "Keep the profile that is on trial");
    verb->add_flag("--revert", options->revert, "Take it back now");
    verb->add_flag("--status", options->status, "Tell what is on trial; exit status 1 when nothing is");
}

}  // namespace veldfwctl
