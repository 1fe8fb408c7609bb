// SPDX-License-Identifier: Apache-2.0
// Reads the per-country address files that the kernel's geoip match uses.
#ifndef VELDFIREWALL_FWGEOIP_H
#define VELDFIREWALL_FWGEOIP_H

#include <json/value.h>
#include <netinet/in.h>

#include <string>
#include <vector>

#include "veldfirewall/export.h"

namespace FW {

/// Country data in "/usr/share/xt_geoip/": CC.iv4 (records of two 32-bit addresses) and CC.iv6 (two addresses of four
/// 32-bit words), words in the machine's byte order, most significant word first. Holds no state. Failures are logged.
class VELDFIREWALL_API FW_GEOIP {
public:
    /// Appends the code of every country with an IPv4 file, in directory order, unsorted. @return false when the
    /// directory cannot be opened
    bool countryEnum(std::vector<std::string> &countries);
    /// Appends to `usable` those of `countries` whose file of the family exists and holds at least 8 bytes.
    /// @return true when `usable` is not empty afterwards; false also for an empty `countries`
    bool geoipSanctify(const std::vector<std::string> &countries, const bool &ipv6, std::vector<std::string> &usable);
    /// Appends one {"ip_begin", "ip_end"} object per record of the country's file. @return false when the file cannot
    /// be opened; a read error half-way ends the list without failure
    bool countryIPGet(const std::string &country, const bool &ipv6, Json::Value &ranges);

    /// The reading behind countryIPGet(); `scratch` holds the last range afterwards. A short last record is completed
    /// with zeros. @return 0, or -1 when the file cannot be opened
    int geoipFileRead(const std::string &country, Json::Value &scratch, Json::Value &ranges, bool ipv6);
    /// Writes dotted decimal text of `value` (most significant byte first) to `out`, cut at `size` bytes with its NUL.
    void Ipv4ToString(unsigned int value, char *out, int size);
    /// Writes eight groups of four hexadecimal digits to `out`, cut at `size`; `value` is four words in host order.
    void Ipv6ToString(in6_addr *value, char *out, int size);
    /// Sets "ip_begin" and "ip_end" of `range`.
    void ParseV4(unsigned int first, unsigned int last, Json::Value &range);
    /// Sets "ip_begin" and "ip_end" of `range`.
    void ParseV6(in6_addr *first, in6_addr *last, Json::Value &range);
};

}  // namespace FW

#endif
