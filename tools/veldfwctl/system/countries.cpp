// SPDX-License-Identifier: Apache-2.0
// Which countries have address data.
#include "system/countries.h"

#include <veldfirewall/fwGeoip.h>

#include "frame/libraryCall.h"

namespace veldfwctl {

CountryData countryDataGet(const std::string &country) {
    CountryData data;
    libraryCall([&] {
        std::vector<std::string> usable;
        data.v4 = FW::FW_GEOIP().geoipSanctify({country}, false, usable);
        usable.clear();
        data.v6 = FW::FW_GEOIP().geoipSanctify({country}, true, usable);
        return true;
    });
    return data;
}

}  // namespace veldfwctl
