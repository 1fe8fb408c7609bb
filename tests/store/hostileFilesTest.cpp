// SPDX-License-Identifier: Apache-2.0
// Broken and hostile files among the profiles hide nothing but themselves.
#include "storeFixture.h"

#include <sys/stat.h>
#include <unistd.h>

using namespace veldtest;
using testing::ElementsAre;

namespace {

const std::string hostile = profileDirectory + "5.json";

std::string nested(const std::string &opening, size_t depth) {
    std::string result;
    for (size_t i = 0; i < depth; ++i)
        result += opening;
    return result;
}

class HostileFiles : public Store {
protected:
    void expectOnlyItselfHidden(const std::string &what, bool reported) {
        SCOPED_TRACE(what);
        store("1.json", namedDocument("first"));
        store("7.json", namedDocument("last"));
        storeSettings("first");
        FW::VELDFW_PROFILE manager;
        takeErrors();
        EXPECT_THAT(names(), ElementsAre("first", "last"));
        EXPECT_EQ(log.count("Failed to load json from " + profileDirectory), reported ? 1u : 0u);
        FW::FWPROFILE profile;
        EXPECT_TRUE(manager.profileGet("last", profile));
        std::map<std::string, FW::FWPROFILE> profiles;
        EXPECT_TRUE(manager.profileEnum(profiles));
        EXPECT_EQ(profiles.size(), 2u);
        EXPECT_TRUE(manager.profileSet("last", profile));
        EXPECT_TRUE(manager.profileRename("last", "renamed"));
        Json::Value exported;
        EXPECT_TRUE(db.exportConfig(exported));
        EXPECT_EQ(exported["config_profiles"].size(), 2u);
        EXPECT_TRUE(manager.profileDelete("renamed"));
        EXPECT_THAT(names(), ElementsAre("first"));
        removeAll(hostile);
    }
};

TEST_F(HostileFiles, OfBrokenTextHideNothingButThemselves) {
    const std::string rules = "{\"name\": \"x\", \"rules\": ";
    const std::string broken[] = {"",
                                  rules + "{",
                                  "\x7f ELF",
                                  std::string(5000, '\0'),
                                  nested("[", 100'000),
                                  nested("{\"a\":", 100'000),
                                  rules + nested("[", 2000) + nested("]", 2000) + "}",
                                  std::string(100'000'000, ' ')};
    for (const std::string &text : broken) {
        writeFile(hostile, text);
        expectOnlyItselfHidden(text.substr(0, 30), true);
    }
    for (const char *foreign : {"[{\"name\": \"x\"}]", "\"name\"", "5", "null", "{\"rules\": {}}", "{\"name\": {}}"}) {
        writeFile(hostile, foreign);
        expectOnlyItselfHidden(foreign, false);
    }
}

TEST_F(HostileFiles, OfOddKindsHideNothingButThemselves) {
    makeDirectories(hostile);
    expectOnlyItselfHidden("directory", true);
    ASSERT_EQ(mkfifo(hostile.c_str(), 0666), 0);
    expectOnlyItselfHidden("FIFO", true);
    for (const char *target : {"nowhere", "5.json", "/dev/zero"}) {
        ASSERT_EQ(symlink(target, hostile.c_str()), 0);
        expectOnlyItselfHidden(target, true);
    }
    store(std::string(250, 'x') + ".json", namedDocument("x"));
    expectOnlyItselfHidden("name that is too long for a lock file", true);
}

TEST_F(HostileFiles, WithWronglyTypedValuesAreReadAsFarAsTheyConvertAndHideNoOther) {
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
