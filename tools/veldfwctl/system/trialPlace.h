// SPDX-License-Identifier: Apache-2.0
// Where a trial keeps its lock, its record and the socket of its watch: /run/veld.
#ifndef VELDFWCTL_TRIALPLACE_H
#define VELDFWCTL_TRIALPLACE_H

#include <optional>
#include <string>

#include "model/trialRecord.h"
#include "system/descriptor.h"

namespace veldfwctl {

/// Takes the lock that the watch of a trial holds as long as it lives. @return closed while another process holds it
/// @throws Failure when the lock cannot be created
Descriptor trialLockTake();

/// The record of the last trial; nothing when there was none since the machine started.
std::optional<TrialRecord> trialRecordRead();
/// Makes the file of the record with room for every later one. @throws Failure
Descriptor trialRecordCreate(const TrialRecord &record);
/// Replaces the record, in its own room. A failure is logged only: nothing depends on it.
void trialRecordWrite(const Descriptor &file, const TrialRecord &record);

/// The watch's end of the socket. @throws Failure
Descriptor trialSocketListen();
void trialSocketRemove();
/// Connects to the watch. @return closed when none listens
Descriptor trialSocketConnect();

/// Sends one message. @return false when the other side has gone
bool messageSend(const Descriptor &socket, const std::string &text);
/// Waits for one message. @return nothing when the other side has gone, or after `milliseconds` (-1: no limit)
std::optional<std::string> messageReceive(const Descriptor &socket, int milliseconds = -1);

}  // namespace veldfwctl

#endif
