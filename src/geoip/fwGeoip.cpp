// SPDX-License-Identifier: Apache-2.0
// Reads the per-country address files that the kernel's geoip match uses.
#include "veldfirewall/fwGeoip.h"

#include <dirent.h>
#include <sys/stat.h>

#include <array>
#include <cstdio>
#include <cstring>
#include <memory>

#include "utils/log.h"

namespace FW {

namespace {

constexpr const char *GEOIP_DIRECTORY = "/usr/share/xt_geoip/";
constexpr const char *IPV4_EXTENSION = ".iv4";
constexpr const char *IPV6_EXTENSION = ".iv6";
constexpr off_t SMALLEST_FILE = 8;  // one IPv4 record, and the threshold for IPv6 as well
constexpr size_t CHUNK_SIZE = 4096;
constexpr size_t PATH_SIZE = 1024;
constexpr size_t ADDRESS_TEXT_SIZE = 64;

struct Ipv4Record {
    uint32_t first;
    uint32_t last;
};

struct Ipv6Record {
    in6_addr first;
    in6_addr last;
};

static_assert(sizeof(Ipv4Record) == 8 && sizeof(Ipv6Record) == 32, "the records are those of the files");
static_assert(CHUNK_SIZE % sizeof(Ipv6Record) == 0, "a record never straddles two chunks");

template <typename Record, typename Parse>
void recordsAppend(const std::array<char, CHUNK_SIZE> &chunk, size_t length, Json::Value &scratch, Json::Value &ranges,
                   Parse parse) {
    for (size_t offset = 0; offset < length; offset += sizeof(Record)) {
        Record record;
        std::memcpy(&record, chunk.data() + offset, sizeof(record));
        scratch.clear();
        parse(record);
        ranges.append(scratch);
    }
}

}  // namespace

bool FW_GEOIP::countryEnum(std::vector<std::string> &countries) {
    const std::unique_ptr<DIR, int (*)(DIR *)> directory(opendir(GEOIP_DIRECTORY), closedir);
    if (!directory) {
        FW_LOG_ERR("Failed to opendir %s", GEOIP_DIRECTORY);
        return false;
    }
    while (const dirent *entry = readdir(directory.get())) {
        const std::string name = entry->d_name;
        if (name.find(IPV4_EXTENSION) != std::string::npos) {
            countries.push_back(name.substr(0, 2));
        }
    }
    return true;
}

bool FW_GEOIP::geoipSanctify(const std::vector<std::string> &countries, const bool &ipv6,
                             std::vector<std::string> &usable) {
    if (countries.empty()) {
        FW_LOG_ERR("There are no country");
        return false;
    }
    for (const std::string &country : countries) {
        std::array<char, PATH_SIZE> path;
        std::snprintf(path.data(), path.size(), "%s%s%s", GEOIP_DIRECTORY, country.c_str(),
                      ipv6 ? IPV6_EXTENSION : IPV4_EXTENSION);
        struct stat status = {};
        if (stat(path.data(), &status) == 0 && status.st_size >= SMALLEST_FILE) {
            usable.push_back(country);
        }
    }
    return !usable.empty();
}

bool FW_GEOIP::countryIPGet(const std::string &country, const bool &ipv6, Json::Value &ranges) {
    Json::Value scratch;
    if (geoipFileRead(country, scratch, ranges, ipv6) < 0) {
        FW_LOG_ERR("Failed to read geoip database");
        return false;
    }
    return true;
}

int FW_GEOIP::geoipFileRead(const std::string &country, Json::Value &scratch, Json::Value &ranges, bool ipv6) {
    const std::string path = GEOIP_DIRECTORY + country + (ipv6 ? IPV6_EXTENSION : IPV4_EXTENSION);
    const std::unique_ptr<FILE, int (*)(FILE *)> file(std::fopen(path.c_str(), "rbe"), std::fclose);
    if (!file) {
        FW_LOG_ERR("Failed to open file %s\n", path.c_str());
        return -1;
    }
    std::array<char, CHUNK_SIZE> chunk = {};
    while (const size_t length = std::fread(chunk.data(), 1, chunk.size(), file.get())) {
        if (ipv6) {
            recordsAppend<Ipv6Record>(chunk, length, scratch, ranges,
                                      [&](Ipv6Record &record) { ParseV6(&record.first, &record.last, scratch); });
        } else {
            recordsAppend<Ipv4Record>(chunk, length, scratch, ranges,
                                      [&](const Ipv4Record &record) { ParseV4(record.first, record.last, scratch); });
        }
        chunk.fill(0);
    }
    return 0;
}

void FW_GEOIP::Ipv4ToString(unsigned int value, char *out, int size) {
    std::snprintf(out, static_cast<size_t>(size), "%u.%u.%u.%u", value >> 24, value >> 16 & 0xff, value >> 8 & 0xff,
                  value & 0xff);
}

void FW_GEOIP::Ipv6ToString(in6_addr *value, char *out, int size) {
    std::array<uint32_t, 4> words;
    std::memcpy(words.data(), value, sizeof(words));
    std::string text;
    for (const uint32_t word : words) {
        std::array<char, 16> groups;
        std::snprintf(groups.data(), groups.size(), "%s%04x:%04x", text.empty() ? "" : ":", word >> 16, word & 0xffff);
        text += groups.data();
    }
    std::snprintf(out, static_cast<size_t>(size), "%s", text.c_str());
}

void FW_GEOIP::ParseV4(unsigned int first, unsigned int last, Json::Value &range) {
    std::array<char, ADDRESS_TEXT_SIZE> text = {};
    Ipv4ToString(first, text.data(), ADDRESS_TEXT_SIZE);
    range["ip_begin"] = text.data();
    text.fill(0);
    Ipv4ToString(last, text.data(), ADDRESS_TEXT_SIZE);
    range["ip_end"] = text.data();
}

void FW_GEOIP::ParseV6(in6_addr *first, in6_addr *last, Json::Value &range) {
    std::array<char, ADDRESS_TEXT_SIZE> text = {};
    Ipv6ToString(first, text.data(), ADDRESS_TEXT_SIZE);
    range["ip_begin"] = text.data();
    text.fill(0);
    Ipv6ToString(last, text.data(), ADDRESS_TEXT_SIZE);
    range["ip_end"] = text.data();
}

}  // namespace FW
