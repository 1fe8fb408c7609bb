// SPDX-License-Identifier: Apache-2.0
// The connections of the demonstration: what the profile says of each and what the network does.
#ifndef VELD_DEMO_CONNECTION_TABLE_H
#define VELD_DEMO_CONNECTION_TABLE_H

#include "appliance.h"
#include "connections.h"
#include "profileDecision.h"

#include <veldfirewall/fwRecords.h>

#include <memory>
#include <string>
#include <vector>

namespace demo {

/// When connections are tried.
enum class Phase { before, enabled, after };

/// One observation of a row.
struct Observation {
    FW::FW_POLICY verdict = FW::FW_POLICY_NONE;  ///< of the library's block query for the port
    veldtest::ProbeResult network = veldtest::ProbeResult::timedOut;
};

/// One connection, tried in each phase.
struct Row {
    const Addresses *addresses;
    const char *title;
    const char *source;
    FW::FW_PORT_PROTOCOL protocol;
    uint16_t port;
    /// What is right while the firewall is on; before and after, every connection is made and nothing is blocked.
    FW::FW_POLICY verdict;
    bool connects;
    /// Made before the firewall is switched on and used in every phase; null: a new connection each time.
    std::shared_ptr<veldtest::Connection> lasting;
    Decision decision;  ///< by the rules, for a new connection
    std::vector<Observation> observations;
};

/// The connections of both families. The lasting ones are made here.
std::vector<Row> makeRows(const veldtest::NetworkNamespace &client, const FW::FWPROFILE &profile);

/// Tries all rows and notes what was seen.
void observe(std::vector<Row> &rows, const veldtest::NetworkNamespace &client);

/// Prints all that was observed. @return number of observations that are not as they must be
int printTable(const std::vector<Row> &rows);

}  // namespace demo

#endif
