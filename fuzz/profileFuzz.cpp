// SPDX-License-Identifier: Apache-2.0
// From a profile's document to its commands: nothing but JsonCpp's exceptions, a document that stays the same once it
// was written back, and commands that iptables-restore reads the same way or that are refused.
#include <json/json.h>

#include "check.h"
#include "db/profileCodec.h"
#include "fw/restoreInput.h"
#include "veldfirewall/fwIptables.h"

using veldfuzz::check;

namespace {

void translate(const FW::FWPROFILE &profile) {
    static FW::VELDFW_IPTABLES_RULES translator;  // keeps what it asked the system
    Json::Value commands;
    for (const auto &[adapter, rules] : profile.rules) {
        for (const FW::FWRULE &rule : rules) {
            Json::Value arguments;
            translator.iptablesRulesInit(arguments);
            if (translator.FwRuleToIptablesArg(adapter, rule, arguments)) {
                translator.iptablesArgToCmd(adapter, rule, arguments, commands);
            }
        }
    }
    if (commands.isNull()) {
        return;
    }
    const std::vector<FW::ListedCommand> listed = FW::commandsInOrder(commands);
    FW::RestoreInput input;
    if (!FW::restoreInputWrite(listed, input)) {
        check(input.commandOfLine.size() >= listed.size(), "every command has its line");
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    const std::string text = veldfuzz::textOf(data, size);
    try {
        Json::Value document;
        if (!Json::Reader().parse(text, document)) {
            return 0;
        }
        FW::FWPROFILE profile;
        FW::profileDecode(document, profile);
        Json::Value once;
        FW::profileEncode(profile, once);
        FW::FWPROFILE again;
        FW::profileDecode(once, again);
        Json::Value twice;
        FW::profileEncode(again, twice);
        check(once == twice, "a written profile is read back as it was");
        translate(profile);
    } catch (const Json::Exception &) {
        return 0;
    }
    return 0;
}
