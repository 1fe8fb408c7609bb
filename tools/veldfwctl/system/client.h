// SPDX-License-Identifier: Apache-2.0
// The connection over which this machine is being administered.
#ifndef VELDFWCTL_CLIENT_H
#define VELDFWCTL_CLIENT_H

#include <optional>
#include <string>

#include "model/packetQuery.h"

namespace veldfwctl {

/// A new connection like that of the environment's SSH_CONNECTION ("CLIENT PORT SERVER PORT"), with the interface that
/// has the server's address; nothing without such a connection.
std::optional<PacketQuery> clientOfSession();

/// A connection from "ADDRESS", "ADDRESS:PORT" or "[ADDRESS]:PORT", PORT being this machine's, 22 when left out, over
/// the interface that leads to the address. @throws UsageError
PacketQuery clientParse(const std::string &text);

}  // namespace veldfwctl

#endif
