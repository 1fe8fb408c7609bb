// SPDX-License-Identifier: Apache-2.0
// Settings and profiles, read and written with messages that name them.
#include "system/store.h"

#include <algorithm>

#include "frame/errors.h"
#include "frame/libraryCall.h"
#include "model/numbers.h"

namespace veldfwctl {

namespace {

constexpr const char *TRIAL_PREFIX = ".test_";
constexpr const char *LOOK_AT_STORE = "look at /usr/veld/etc/firewall.d, or run \"veldfwctl setup\"";

}  // namespace

Settings settingsRead() {
    Settings settings;
    require("Cannot read the settings", LOOK_AT_STORE, [&settings] {
        FW::VELDFW firewall;
        return firewall.fwStatus(settings.enabled) && firewall.fwProfileConfigGet(settings.profile);
    });
    return settings;
}

bool isTrialCopy(const std::string &profile) {
    return profile.rfind(TRIAL_PREFIX, 0) == 0;
}

std::vector<std::string> profileNames() {
    std::vector<std::string> names;
    require("Cannot list the profiles", LOOK_AT_STORE, [&names] { return FW::VELDFW_PROFILE().profileEnum(names); });
    names.erase(std::remove_if(names.begin(), names.end(), isTrialCopy), names.end());
    return names;
}

FW::FWPROFILE profileRead(const std::string &name) {
    FW::FWPROFILE profile;
    const CallResult result = libraryCall([&] { return FW::VELDFW_PROFILE().profileGet(name, profile); });
    if (!result.succeeded) {
        const std::vector<std::string> names = profileNames();
        if (std::find(names.begin(), names.end(), name) == names.end()) {
            throw UsageError("There is no profile \"" + name + "\"; there are: " + join(names, ", "));
        }
        throw Failure("Cannot read profile \"" + name + "\": " + messagesJoin(result.messages) + "; " + LOOK_AT_STORE);
    }
    return profile;
}

FW::FWPROFILE profileChosen(const std::string &named) {
    if (!named.empty()) {
        return profileRead(named);
    }
    try {
        return profileRead(settingsRead().profile);
    } catch (const UsageError &error) {
        throw Failure(std::string("The active profile is missing: ") + error.what() +
                      "; make one of them active with \"veldfwctl profile use NAME\"");
    }
}

void profileWrite(const FW::FWPROFILE &profile) {
    require("Cannot store profile \"" + profile.name + "\"", LOOK_AT_STORE,
            [&profile] { return FW::VELDFW_PROFILE().profileSet(profile.name, profile); });
}

void profileNameCheck(const std::string &name) {
    const bool hasControls =
        std::any_of(name.begin(), name.end(), [](unsigned char c) { return c < 0x20 || c == 0x7F; });
    if (name.empty() || hasControls || isTrialCopy(name)) {
        throw UsageError("\"" + name + "\" cannot name a profile; use text that does not begin with " + TRIAL_PREFIX);
    }
}

std::set<std::string> adapterNames() {
    std::set<std::string> names;
    require("Cannot list the adapters", "run \"ip link\" to see whether the system can",
            [&names] { return FW::VELDFW().fwAdapterEnum(names); });
    return names;
}

}  // namespace veldfwctl
