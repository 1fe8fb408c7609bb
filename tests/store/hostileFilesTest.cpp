// SPDX-License-Identifier: Apache-2.0
// Broken and hostile files among the profiles hide nothing but themselves.
#include "storeFixture.h"

#include <sys/stat.h>
#include <unistd.h>

using namespace veldtest;
using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

const std::string hostile = profileDirectory + "5.json";

struct HostileFile {
    std::string name;
    std::function<void()> make;
    bool reported = true;  ///< or skipped without a word
};

void PrintTo(const HostileFile &file, std::ostream *out) {
    *out << file.name;
}

HostileFile text(const std::string &name, const std::string &content) {
    return {name, [content] { writeFile(hostile, content); }, true};
}

HostileFile foreign(const std::string &name, const std::string &content) {
    return {name, [content] { writeFile(hostile, content); }, false};
}

HostileFile link(const std::string &name, const char *target) {
    return {name, [target] { ASSERT_EQ(symlink(target, hostile.c_str()), 0); }, true};
}

std::string nested(const std::string &opening, size_t depth) {
    std::string result;
    for (size_t i = 0; i < depth; ++i)
        result += opening;
    return result;
}

class HostileFiles : public Store, public testing::WithParamInterface<HostileFile> {};

TEST_P(HostileFiles, HideNothingButThemselves) {
    GetParam().make();
    store("1.json", namedDocument("first"));
    store("7.json", namedDocument("last"));
    storeSettings("first");
    FW::VELDFW_PROFILE manager;
    EXPECT_THAT(names(), ElementsAre("first", "last"));
    const auto errors = takeErrors();
    if (GetParam().reported)
        EXPECT_THAT(errors, Contains(testing::StartsWith("fwDB.cpp Failed to load json from " + profileDirectory)));
    else
        EXPECT_THAT(errors, IsEmpty());
    FW::FWPROFILE profile;
    EXPECT_TRUE(manager.profileGet("last", profile));
    std::map<std::string, FW::FWPROFILE> profiles;
    EXPECT_TRUE(manager.profileEnum(profiles));
    EXPECT_EQ(profiles.size(), 2u);
    EXPECT_TRUE(manager.profileSet("last", profile));
    EXPECT_TRUE(manager.profileCreate("new"));
    EXPECT_TRUE(manager.profileRename("last", "renamed"));
    EXPECT_TRUE(manager.profileDelete("renamed"));
    bool enabled = true;
    EXPECT_TRUE(FW::VELDFW().fwStatus(enabled));
    Json::Value exported;
    EXPECT_TRUE(db.exportConfig(exported));
    EXPECT_EQ(exported["config_profiles"].size(), 2u);
    EXPECT_THAT(names(), ElementsAre("first", "new"));
}

INSTANTIATE_TEST_SUITE_P(
    , HostileFiles,
    testing::Values(text("Empty", ""), text("Truncated", "{\"name\": \"x\", \"rules\": {"),
                    text("NoJson", "\x7f"
                                   "ELF"),
                    text("ZeroBytes", std::string(5000, '\0')), text("NestedBrackets", nested("[", 100'000)),
                    text("NestedObjects", nested("{\"a\":", 100'000)),
                    text("NestedRules", "{\"name\": \"x\", \"rules\": " + nested("[", 2000) + nested("]", 2000) + "}"),
                    HostileFile{"Blanks", [] { writeFile(hostile, std::string(100'000'000, ' ')); }, true},
                    HostileFile{"Directory", [] { makeDirectories(hostile); }, true},
                    HostileFile{"Fifo", [] { ASSERT_EQ(mkfifo(hostile.c_str(), 0666), 0); }, true},
                    HostileFile{"LongName", [] { store(std::string(250, 'x') + ".json", namedDocument("x")); }, true},
                    link("DanglingLink", "nowhere"), link("LinkToItself", "5.json"), link("EndlessDevice", "/dev/zero"),
                    foreign("ArrayRoot", "[{\"name\": \"x\"}]"), foreign("TextRoot", "\"name\""),
                    foreign("NumberRoot", "5"), foreign("NullRoot", "null"), foreign("NoName", "{\"rules\": {}}"),
                    foreign("NumberForName", "{\"name\": 5}"), foreign("ObjectForName", "{\"name\": {}}")),
    [](const auto &entry) { return entry.param.name; });

class WronglyTypedProfile : public Store {};

TEST_F(WronglyTypedProfile, IsReadAsFarAsItsValuesConvertAndHidesNoOther) {
    const std::pair<std::string, bool> cases[] = {
        // members, can be converted
        {R"("rules": 5)", true},
        {R"("rules": [], "adapterPolicyMap": "x")", true},
        {R"("rules": {"eth0": 5})", true},
        {R"("rules": {"eth0": [{"ipList": 5, "name": false}]})", true},
        {R"("rules": {"eth0": [5]})", false},
        {R"("rules": )" + nested("[", 500) + nested("]", 500), false},
        {R"("rules": {"eth0": [{"policy": {}}]})", false},
        {R"("rules": {"eth0": [{"ruleID": 1e30}]})", false},
        {R"("adapterPolicyMap": {"eth0": []})", false},
    };
    store("7.json", namedDocument("good"));
    storeSettings("good");
    for (const auto &[members, convertible] : cases) {
        SCOPED_TRACE(members.substr(0, 60));
        store("5.json", "{\"name\": \"bad\", " + members + "}");
        EXPECT_THAT(names(), ElementsAre("bad", "good"));
        FW::FWPROFILE profile;
        EXPECT_TRUE(db.profileGet("good", profile));
        std::map<std::string, FW::FWPROFILE> profiles;
        if (convertible) {
            EXPECT_TRUE(db.profileGet("bad", profile));
            EXPECT_TRUE(db.profileEnum(profiles));
        } else {
            EXPECT_THROW(db.profileGet("bad", profile), Json::LogicError);
            EXPECT_THROW(db.profileEnum(profiles), Json::LogicError);
        }
        EXPECT_TRUE(db.profileSet("good", {"good", {}, {}}));
        Json::Value exported;
        EXPECT_TRUE(db.exportConfig(exported));
        EXPECT_EQ(exported["config_profiles"].size(), 2u);
        EXPECT_TRUE(FW::VELDFW_PROFILE().profileDelete("bad"));
        EXPECT_THAT(names(), ElementsAre("good"));
    }
}

}  // namespace
