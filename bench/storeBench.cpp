// SPDX-License-Identifier: Apache-2.0
// Reading profiles and asking what they block, beside reading the files that hold them.
#include "benchmarks.h"
#include "fixtures.h"

#include "files.h"

#include <glob.h>

#include <memory>

#include "veldfirewall/utils.h"
#include "veldfirewall/veldFW.h"

namespace veldbench {

namespace {

constexpr size_t RULES = 20;

void loadAll(const std::vector<std::string> &paths) {
    for (const std::string &path : paths) {
        Json::Value document;
        require(FW::jsonFileLoad(document, path), "jsonFileLoad() failed");
    }
}

/// What finding a profile by its name costs at least: which files there are, and what each says.
void scanStore() {
    glob_t matches = {};
    require(glob((std::string(STORE) + "/*.json").c_str(), GLOB_ERR, nullptr, &matches) == 0, "glob failed");
    for (size_t i = 0; i < matches.gl_pathc; ++i) {
        Json::Value document;
        require(FW::jsonFileLoad(document, matches.gl_pathv[i]), "jsonFileLoad() failed");
    }
    globfree(&matches);
}

void enumProfiles(size_t count) {
    std::map<std::string, FW::FWPROFILE> profiles;
    require(FW::VELDFW_PROFILE().profileEnum(profiles) && profiles.size() == count, "profileEnum() failed");
}

void getProfile(const std::string &name) {
    FW::FWPROFILE profile;
    require(FW::VELDFW_PROFILE().profileGet(name, profile) && profile.name == name && !profile.rules.empty(),
            "profileGet() failed");
}

void askService() {
    std::map<std::string, FW::FW_POLICY> verdicts;
    require(FW::VELDFW().fwServIsBlocked(SERVICE_OF_SEVEN_PORTS, "", verdicts), "fwServIsBlocked() failed");
    require(verdicts.count(interfaceNames().front()) == 1, "fwServIsBlocked() gave no verdict");
}

}  // namespace

void registerStoreBenchmarks(const Scale &scale) {
    for (const auto &[profiles, rounds] : {std::pair(1, 400), {10, 150}, {100, 40}, {1000, 9}}) {
        if (scale.smoke && profiles > 10) {
            continue;
        }
        const auto count = static_cast<size_t>(profiles);
        registerBar("profileEnum/profiles:" + std::to_string(profiles), scale.rounds(rounds),
                    [count](benchmark::State &state) {
                        const auto paths = fillStore(count, RULES);
                        measurePair(state, {1.5}, {[=] { enumProfiles(count); }, [=] { loadAll(paths); }, {}, true});
                    });
        registerBar("profileGet/profiles:" + std::to_string(profiles), scale.rounds(rounds),
                    [count](benchmark::State &state) {
                        fillStore(count, RULES);
                        const std::string name = profileName(count / 2);
                        measurePair(state, {1.2}, {[=] { getProfile(name); }, scanStore, {}, true});
                    });
    }
    const size_t stored = scale.smoke ? 10 : 100;
    registerBar("fwServIsBlocked/ports:7, profiles:" + std::to_string(stored), scale.rounds(40),
                [stored](benchmark::State &state) {
                    installServices();
                    fillStore(stored, RULES);
                    veldtest::writeFile(std::string(STORE) + "/firewall_settings.json",
                                        "{ \"profile\" : \"" + profileName(stored / 2) + "\", \"status\" : true }");
                    measurePair(state, {1.5}, {askService, scanStore, {}, true});
                });
}

}  // namespace veldbench
