// SPDX-License-Identifier: Apache-2.0
// Reading country files.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/json.h>

#include <cstring>

#include "files.h"
#include "systemLog.h"
#include "veldfirewall/fwGeoip.h"

using namespace veldtest;
using testing::ElementsAre;
using testing::UnorderedElementsAre;

namespace {

const std::string DIRECTORY = "/usr/share/xt_geoip/";

/// Words in the machine's byte order, as the data package writes them.
std::string words(const std::vector<uint32_t> &values) {
    std::string bytes(values.size() * 4, '\0');
    std::memcpy(bytes.data(), values.data(), bytes.size());
    return bytes;
}

class Geoip : public testing::Test {
protected:
    Geoip() { removeAll(DIRECTORY); }

    SystemLog log;
    FW::FW_GEOIP geoip;
};

struct Reading {
    const char *name;
    bool ipv6;
    std::string content;
    std::vector<std::pair<std::string, std::string>> ranges;
};

class GeoipFile : public Geoip, public testing::WithParamInterface<Reading> {};

TEST_P(GeoipFile, GivesItsRanges) {
    const Reading &reading = GetParam();
    writeFile(DIRECTORY + "DE" + (reading.ipv6 ? ".iv6" : ".iv4"), reading.content);
    Json::Value ranges(Json::arrayValue);
    ranges.append("before");
    EXPECT_TRUE(geoip.countryIPGet("DE", reading.ipv6, ranges));
    ASSERT_EQ(ranges.size(), reading.ranges.size() + 1);
    EXPECT_EQ(ranges[0], "before");
    for (unsigned i = 0; i < reading.ranges.size(); ++i) {
        EXPECT_EQ(ranges[i + 1]["ip_begin"], reading.ranges[i].first);
        EXPECT_EQ(ranges[i + 1]["ip_end"], reading.ranges[i].second);
    }
    EXPECT_TRUE(log.messages().empty()) << log.text();
}

INSTANTIATE_TEST_SUITE_P(
    Case, GeoipFile,
    testing::Values(
        Reading{"Empty", false, "", {}},
        Reading{"OneRange", false, words({0x0A000001, 0xFF0080C8}), {{"10.0.0.1", "255.0.128.200"}}},
        Reading{"TwelveBytes", false, words({1, 2, 0xC0A80001}), {{"0.0.0.1", "0.0.0.2"}, {"192.168.0.1", "0.0.0.0"}}},
        Reading{"OneIpv6Range",
                true,
                words({0x20010DB8, 0, 0, 1, 0x20010DB8, 0xFFFFFFFF, 0xABCDEF01, 0x12345678}),
                {{"2001:0db8:0000:0000:0000:0000:0000:0001", "2001:0db8:ffff:ffff:abcd:ef01:1234:5678"}}},
        Reading{"ShortIpv6Record",
                true,
                words({0x20010DB8}),
                {{"2001:0db8:0000:0000:0000:0000:0000:0000", "0000:0000:0000:0000:0000:0000:0000:0000"}}}),
    [](const auto &entry) { return entry.param.name; });

TEST_F(Geoip, FilesLongerThanOneReadGiveEveryRangeOnceWithoutRestsOfTheLast) {
    constexpr uint32_t COUNT = 1100;  // 8800 bytes, and half a record
    std::vector<uint32_t> values;
    for (uint32_t i = 0; i < COUNT; ++i)
        values.insert(values.end(), {i, i + 0x01000000});
    values.push_back(COUNT);
    writeFile(DIRECTORY + "DE.iv4", words(values));
    Json::Value ranges;
    EXPECT_TRUE(geoip.countryIPGet("DE", false, ranges));
    ASSERT_EQ(ranges.size(), COUNT + 1);
    EXPECT_EQ(ranges[511]["ip_begin"], "0.0.1.255");
    EXPECT_EQ(ranges[512]["ip_end"], "1.0.2.0");
    EXPECT_EQ(ranges[COUNT - 1]["ip_end"], "1.0.4.75");
    EXPECT_EQ(ranges[COUNT]["ip_begin"], "0.0.4.76");
    EXPECT_EQ(ranges[COUNT]["ip_end"], "0.0.0.0");
}

TEST_F(Geoip, MissingFileIsNamed) {
    Json::Value ranges;
    EXPECT_FALSE(geoip.countryIPGet("XX", true, ranges));
    EXPECT_TRUE(ranges.empty());
    EXPECT_TRUE(log.contains("Failed to open file /usr/share/xt_geoip/XX.iv6")) << log.text();
    EXPECT_TRUE(log.contains("Failed to read geoip database"));
}

TEST_F(Geoip, CountriesAreThoseWithIv4AnywhereInAName) {
    for (const char *name : {"DE.iv4", "de.iv4.old", "FR.iv6", "x.iv4", "README", "USA.iv4"})
        writeFile(DIRECTORY + name, "");
    std::vector<std::string> countries = {"before"};
    EXPECT_TRUE(geoip.countryEnum(countries));
    EXPECT_THAT(countries, UnorderedElementsAre("before", "DE", "de", "x.", "US"));
    EXPECT_EQ(countries[0], "before");
    removeAll(DIRECTORY);
    EXPECT_FALSE(geoip.countryEnum(countries));
    EXPECT_TRUE(log.contains("Failed to opendir /usr/share/xt_geoip/")) << log.text();
}

TEST_F(Geoip, CountriesWithEightBytesAreUsableInBothFamilies) {
    writeFile(DIRECTORY + "AA.iv4", std::string(8, '\0'));
    writeFile(DIRECTORY + "AA.iv6", std::string(7, '\0'));
    writeFile(DIRECTORY + "BB.iv4", "");
    writeFile(DIRECTORY + "BB.iv6", std::string(8, '\0'));
    std::vector<std::string> usable;
    EXPECT_TRUE(geoip.geoipSanctify({"BB", "AA", "XX", "AA"}, false, usable));
    EXPECT_THAT(usable, ElementsAre("AA", "AA"));
    EXPECT_TRUE(geoip.geoipSanctify({"XX"}, false, usable)) << "what was usable before counts";
    usable.clear();
    EXPECT_TRUE(geoip.geoipSanctify({"AA", "BB"}, true, usable));
    EXPECT_THAT(usable, ElementsAre("BB"));
    usable.clear();
    EXPECT_FALSE(geoip.geoipSanctify({"XX"}, true, usable));
    EXPECT_TRUE(log.messages().empty()) << log.text();
    EXPECT_FALSE(geoip.geoipSanctify({}, true, usable));
    EXPECT_TRUE(log.contains("There are no country"));
}

TEST_F(Geoip, AddressTextIsCutAtTheBuffersSize) {
    char text[6] = "?????";
    geoip.Ipv4ToString(0x0A0B0C0D, text, sizeof(text));
    EXPECT_STREQ(text, "10.11");
    in6_addr address = {};
    geoip.Ipv6ToString(&address, text, sizeof(text));
    EXPECT_STREQ(text, "0000:");
}

}  // namespace
