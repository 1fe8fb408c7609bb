// SPDX-License-Identifier: Apache-2.0
// "country": the address data of countries.
#include <veldfirewall/fwGeoip.h>

#include <algorithm>
#include <memory>

#include "frame/libraryCall.h"
#include "frame/verb.h"
#include "model/addresses.h"
#include "system/countries.h"

namespace veldfwctl {

namespace {

struct Options {
    std::string country;
    bool onlyV4 = false;
    bool onlyV6 = false;
    bool networks = false;
};

int list(const Context &context) {
    std::vector<std::string> codes;
    require("Cannot list the countries", "install address data in /usr/share/xt_geoip",
            [&codes] { return FW::FW_GEOIP().countryEnum(codes); });
    std::sort(codes.begin(), codes.end());
    codes.erase(std::unique(codes.begin(), codes.end()), codes.end());
    Json::Value json = Json::arrayValue;
    Table table{{"COUNTRY", "IPV4", "IPV6"}, {}};
    for (const std::string &code : codes) {
        const CountryData data = countryDataGet(code);
        Json::Value entry;
        entry["country"] = code;
        entry["ipv4"] = data.v4;
        entry["ipv6"] = data.v6;
        json.append(entry);
        table.rows.push_back({code, data.v4 ? "yes" : "-", data.v6 ? "yes" : "-"});
    }
    context.json ? context.printJson(json) : context.printTable(table);
    return STATUS_DONE;
}

Json::Value rangesRead(const std::string &country, bool ipv6) {
    Json::Value ranges = Json::arrayValue;
    require("Cannot read the address data of \"" + country + "\"", "install it anew in /usr/share/xt_geoip",
            [&] { return FW::FW_GEOIP().countryIPGet(country, ipv6, ranges); });
    return ranges;
}

int ranges(const Context &context, const Options &options) {
    const bool isCode = options.country.size() == 2 && options.country.find_first_of("/.") == std::string::npos;
    const CountryData data = isCode ? countryDataGet(options.country) : CountryData{};
    if (!data.v4 && !data.v6) {
        throw UsageError("Country \"" + options.country + "\" has no address data; see \"veldfwctl country list\"");
    }
    Json::Value json = Json::arrayValue;
    const auto show = [&](const std::string &text) {
        context.print(text);
        json.append(text);
    };
    for (const bool ipv6 : {false, true}) {
        if (!(ipv6 ? data.v6 && !options.onlyV4 : data.v4 && !options.onlyV6)) {
            continue;
        }
        for (const Json::Value &range : rangesRead(options.country, ipv6)) {
            const std::optional<Address> first = addressFromText(range["ip_begin"].asString());
            const std::optional<Address> last = addressFromText(range["ip_end"].asString());
            if (!first || !last) {
                throw Failure("The address data of \"" + options.country +
                              "\" holds a range that is none; install it "
                              "anew in /usr/share/xt_geoip");
            }
            if (options.networks) {
                for (const std::string &network : rangeNetworks(*first, *last)) {
                    show(network);
                }
            } else {
                show(addressText(*first) + "-" + addressText(*last));
            }
        }
    }
    if (context.json) {
        context.printJson(json);
    }
    return STATUS_DONE;
}

}  // namespace

void registerCountry(CLI::App &app, Context &context) {
    CLI::App *group = verbGroupAdd(app, "country", "Address data of countries: list, ranges");
    const auto options = std::make_shared<Options>();
    verbAdd(*group, context, {"list", "List the countries that rules can name", "veldfwctl country list", [&context] {
                                  return list(context);
                              }});
    CLI::App *verb = verbAdd(*group, context,
                             {"ranges", "Print the addresses of a country", "veldfwctl country ranges DE --networks",
                              [&context, options] { return ranges(context, *options); }});
    verb->add_option("COUNTRY", options->country, "Code of two letters, as \"country list\" prints it")->required();
    CLI::Option *v4 = verb->add_flag("-4,--ipv4", options->onlyV4, "Only IPv4");
    verb->add_flag("-6,--ipv6", options->onlyV6, "Only IPv6")->excludes(v4);
    verb->add_flag("--networks", options->networks, "As networks (10.0.0.0/8) instead of ranges");
}

}  // namespace veldfwctl
