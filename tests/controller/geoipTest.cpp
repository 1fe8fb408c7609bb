// SPDX-License-Identifier: Apache-2.0
// Reading country files.
#include "files.h"
#include "systemLog.h"
#include "veldfirewall/fwGeoip.h"

using namespace veldtest;
using testing::ElementsAre;

namespace {

const std::string DIRECTORY = "/usr/share/xt_geoip/";

class Geoip : public testing::Test {
protected:
    /// What a file of these words gives, which are in the machine's byte order: "begin-end", in order.
    std::vector<std::string> ranges(bool ipv6, const std::vector<uint32_t> &words) {
        writeFile(DIRECTORY + (ipv6 ? "DE.iv6" : "DE.iv4"),
                  {reinterpret_cast<const char *>(words.data()), words.size() * sizeof(uint32_t)});
        Json::Value json;
        EXPECT_TRUE(geoip.countryIPGet("DE", ipv6, json)) << log.text();
        std::vector<std::string> texts;
        for (const Json::Value &range : json)
            texts.push_back(range["ip_begin"].asString() + "-" + range["ip_end"].asString());
        return texts;
    }

    SystemLog log;
    FW::FW_GEOIP geoip;
};

TEST_F(Geoip, FilesGiveTheirRangesAndAShortLastRecordIsFilledWithZeros) {
    EXPECT_THAT(ranges(false, {}), ElementsAre());
    EXPECT_THAT(ranges(false, {0x0A000001, 0xFF0080C8, 0xC0A80001}),
                ElementsAre("10.0.0.1-255.0.128.200", "192.168.0.1-0.0.0.0"));
    EXPECT_THAT(ranges(true, {0x20010DB8, 0, 0, 1, 0x20010DB8, 0xFFFFFFFF, 0xABCDEF01, 0x12345678, 0xFD000000}),
                ElementsAre("2001:0db8:0000:0000:0000:0000:0000:0001-2001:0db8:ffff:ffff:abcd:ef01:1234:5678",
                            "fd00:0000:0000:0000:0000:0000:0000:0000-0000:0000:0000:0000:0000:0000:0000:0000"));
    // Longer than one read: nothing of an earlier read may show in the last record.
    std::vector<uint32_t> values;
    for (uint32_t i = 0; i < 1100; ++i)
        values.insert(values.end(), {i, i + 0x01000000});
    values.push_back(1100);
    const auto all = ranges(false, values);
    ASSERT_EQ(all.size(), 1101u);
    EXPECT_EQ(all[511] + " " + all[512] + " " + all[1100], "0.0.1.255-1.0.1.255 0.0.2.0-1.0.2.0 0.0.4.76-0.0.0.0");
}

TEST_F(Geoip, CountriesAreThoseWithIv4AnywhereInANameAndUsableWithEightBytes) {
    for (const char *name : {"DE.iv4", "de.iv4.old", "FR.iv6", "x.iv4", "README", "USA.iv4"})
        writeFile(DIRECTORY + name, name == std::string("DE.iv4") ? "8 bytes." : "7 bytes");
    std::vector<std::string> countries = {"before"};
    EXPECT_TRUE(geoip.countryEnum(countries));
    EXPECT_THAT(countries, testing::UnorderedElementsAre("before", "DE", "de", "x.", "US"));
    std::vector<std::string> usable;
    EXPECT_TRUE(geoip.geoipSanctify({"USA", "DE", "XX", "DE"}, false, usable));
    EXPECT_THAT(usable, ElementsAre("DE", "DE"));
    EXPECT_TRUE(geoip.geoipSanctify({"XX"}, false, usable)) << "what was usable before counts";
    usable.clear();
    EXPECT_FALSE(geoip.geoipSanctify({"FR", "DE"}, true, usable)) << "of that family";
    EXPECT_FALSE(geoip.geoipSanctify({}, true, usable));
    removeAll(DIRECTORY);
    EXPECT_FALSE(geoip.countryEnum(countries));
    Json::Value none;
    EXPECT_FALSE(geoip.countryIPGet("XX", true, none));
    for (const char *message : {"There are no country", "Failed to opendir /usr/share/xt_geoip/",
                                "Failed to open file /usr/share/xt_geoip/XX.iv6", "Failed to read geoip database"})
        EXPECT_TRUE(log.contains(message)) << log.text();
}

}  // namespace
