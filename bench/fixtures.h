// SPDX-License-Identifier: Apache-2.0
// What the benchmarks work on: profiles, services, interfaces. All of it in the sandbox.
#ifndef VELD_BENCH_FIXTURES_H
#define VELD_BENCH_FIXTURES_H

#include <json/value.h>

#include <string>
#include <vector>

#include "veldfirewall/fwRecords.h"

namespace veldbench {

inline constexpr const char *STORE = "/usr/veld/etc/firewall.d";
inline constexpr const char *SERVICE_OF_SEVEN_PORTS = "seven_ports";

/// Interfaces that rules of makeProfile() are bound to, beside "global".
const std::vector<std::string> &interfaceNames();
/// Adds them.
void addInterfaces();
/// Installs a network tool that notes each call and knows of no tunnel.
void installNetworkTool();
/// Calls since the last call of this function.
size_t takeNetworkToolCalls();
/// Defines services as an installation has them, one of them with seven ports.
void installServices();
/// Installs country files.
void installCountries();

/// A profile of rules of all kinds (addresses, networks, ranges, countries; ports, port lists, services), spread over
/// the adapters.
FW::FWPROFILE makeProfile(const std::string &name, size_t rules);
/// Its document.
Json::Value profileDocument(const FW::FWPROFILE &profile);
/// The text of a document, as it is stored.
std::string documentText(const Json::Value &document);

/// Fills the empty store with that many profiles "profile 0000", ... and returns the paths of their files.
std::vector<std::string> fillStore(size_t profiles, size_t rulesEach);
/// Empties the store.
void clearStore();
/// Name of the n-th profile of fillStore().
std::string profileName(size_t n);

}  // namespace veldbench

#endif
