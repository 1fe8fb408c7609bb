// SPDX-License-Identifier: Apache-2.0
// Country files: one range per record, the last one completed with zeros. The first byte chooses the family.
#include <arpa/inet.h>
#include <json/value.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstring>
#include <fstream>

#include "check.h"
#include "veldfirewall/fwGeoip.h"

using veldfuzz::check;

namespace {

constexpr const char *DIRECTORY = "/usr/share/xt_geoip";
bool isPrivate = false;

}  // namespace

/// The place of country files is fixed: this process gets a /usr/share of its own.
extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    const bool isUnshared = unshare(CLONE_NEWNS) == 0 || unshare(CLONE_NEWUSER | CLONE_NEWNS) == 0;
    isPrivate = isUnshared && mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0 &&
                mount("tmpfs", "/usr/share", "tmpfs", 0, nullptr) == 0 && mkdir(DIRECTORY, 0755) == 0;
    if (!isPrivate) {
        std::fprintf(stderr, "skipped: no mount namespace of its own is allowed here\n");
    }
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    if (size == 0 || !isPrivate) {
        return 0;
    }
    const bool v6 = data[0] % 2 != 0;
    std::string content = veldfuzz::textOf(data + 1, size - 1);
    {
        std::ofstream file(std::string(DIRECTORY) + (v6 ? "/XX.iv6" : "/XX.iv4"), std::ios::binary);
        file << content;
    }
    Json::Value ranges(Json::arrayValue);
    check(FW::FW_GEOIP().countryIPGet("XX", v6, ranges), "the file is read");
    const size_t half = v6 ? 16 : 4;
    const size_t records = (content.size() + 2 * half - 1) / (2 * half);
    check(ranges.size() == records, "a range per record");
    content.resize(records * 2 * half);
    for (size_t i = 0; i < 2 * records; ++i) {
        std::string expected;
        for (size_t word = 0; word < half / 4; ++word) {
            uint32_t value = 0;
            std::memcpy(&value, content.data() + i * half + word * 4, 4);
            char text[32];
            if (v6) {
                std::snprintf(text, sizeof(text), "%s%04x:%04x", word > 0 ? ":" : "", value / 65536, value % 65536);
            } else {
                const uint32_t network = htonl(value);
                inet_ntop(AF_INET, &network, text, sizeof(text));
            }
            expected += text;
        }
        const Json::Value &range = ranges[static_cast<Json::ArrayIndex>(i / 2)];
        check(range[i % 2 == 0 ? "ip_begin" : "ip_end"].asString() == expected, "the addresses of the record");
    }
    return 0;
}
