// SPDX-License-Identifier: Apache-2.0
// Which countries have address data.
#ifndef VELDFWCTL_COUNTRIES_H
#define VELDFWCTL_COUNTRIES_H

#include <string>

#include "model/ruleRequest.h"

namespace veldfwctl {

/// The families for which the library finds data of the country. @param country code as its files are named
CountryData countryDataGet(const std::string &country);

}  // namespace veldfwctl

#endif
