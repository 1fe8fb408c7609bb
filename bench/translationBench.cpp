// SPDX-License-Identifier: Apache-2.0
// Translating a profile, beside parsing its document.
#include "benchmarks.h"
#include "fixtures.h"

#include <json/reader.h>

#include <memory>

#include "veldfirewall/fwIptables.h"

// Documents are read with JsonCpp's older reader.
#pragma GCC diagnostic ignored "-Wdeprecated-declarations"

namespace veldbench {

namespace {

// Ten times the rules may cost this times ten times as much: larger profiles leave the processor's caches.
constexpr double GROWTH = 1.5;

void setUp() {
    static const bool done = [] {
        addInterfaces();
        installNetworkTool();
        installServices();
        installCountries();
        return true;
    }();
    require(done, "no fixtures");
}

size_t commandCount(const Json::Value &commands) {
    size_t count = 0;
    for (const Json::Value &family : commands) {
        for (const Json::Value &group : family) {
            count += group.size();
        }
    }
    return count;
}

/// A translator that has asked the system already: what it asks for does not depend on the number of rules.
struct Translation {
    explicit Translation(size_t rules) : profile(makeProfile("translated", rules)) {
        text = documentText(profileDocument(profile));
    }

    void translate() {
        Json::Value commands;
        translator.jIptablesCmdInit(commands);
        require(translator.fwRulesToIptablesRules(true, profile.rules, profile.adapterPolicyMap, commands),
                "fwRulesToIptablesRules() failed");
        // Every rule is usable: at least one command for each of its two chains.
        size_t rules = 0;
        for (const auto &[adapter, list] : profile.rules) {
            rules += list.size();
        }
        require(commandCount(commands) >= 2 * rules, "rules are missing in the command list");
    }

    void parse() const {
        Json::Value document;
        require(Json::Reader().parse(text, document) && document.isMember("rules"), "parse failed");
    }

    FW::FWPROFILE profile;
    std::string text;
    FW::VELDFW_IPTABLES_RULES translator;
};

}  // namespace

void registerTranslationBenchmarks(const Scale &scale) {
    for (const auto &[rules, rounds] : {std::pair(10, 400), {100, 200}, {1000, 60}, {10000, 15}}) {
        if (scale.smoke && rules > 100) {
            continue;
        }
        registerBar(
            "translate/rules:" + std::to_string(rules) + " beside parsing", scale.rounds(rounds),
            [count = static_cast<size_t>(rules)](benchmark::State &state) {
                setUp();
                const auto translation = std::make_shared<Translation>(count);
                measurePair(state, {1.0}, {[=] { translation->translate(); }, [=] { translation->parse(); }, {}, true});
            });
    }
    const int most = scale.smoke ? 100 : 10000;
    registerBar("translate/growth, rules:" + std::to_string(most) + " beside 10 x " + std::to_string(most / 10),
                scale.rounds(15), [most](benchmark::State &state) {
                    setUp();
                    const auto large = std::make_shared<Translation>(static_cast<size_t>(most));
                    const auto small = std::make_shared<Translation>(static_cast<size_t>(most / 10));
                    measurePair(state, {GROWTH},
                                {[=] { large->translate(); },
                                 [=] {
                                     for (int i = 0; i < 10; ++i) {
                                         small->translate();
                                     }
                                 },
                                 {},
                                 true});
                });
    registerBar("translate/calls of the network tool per interface", 1, [](benchmark::State &state) {
        setUp();
        takeNetworkToolCalls();
        for ([[maybe_unused]] auto round : state) {
            state.SetIterationTime(microseconds([] { Translation(100).translate(); }) / 1e6);
        }
        const auto calls = static_cast<double>(takeNetworkToolCalls());
        // "global" is asked like an interface.
        const auto adapters = static_cast<double>(interfaceNames().size() + 1);
        require(calls >= 1, "the network tool was not asked at all");
        report(state, {1.0, ""}, calls, adapters, calls / adapters);
    });
}

}  // namespace veldbench
