/* SPDX-License-Identifier: Apache-2.0 */
/* Files that the recording program and the recorder share, in the sandbox. */
#ifndef VELD_TEST_RECORDING_PROGRAM_H
#define VELD_TEST_RECORDING_PROGRAM_H

#define RECORDER_DIRECTORY "/run/command-recorder"
/* Per run: open descriptors above 2 joined by blanks, then the words (argv), each of them followed by NUL; at the end
 * END_OF_RUN. */
#define RECORDER_RECORD RECORDER_DIRECTORY "/record"
#define END_OF_RUN '\036'
/* A rule per line: number of the run or 0, exit status, nanoseconds to wait; after a tab each, a part of the command
 * and "=" with a text for stderr. */
#define RECORDER_RULES RECORDER_DIRECTORY "/rules"
#define RECORDER_RULE_FORMAT "%ld %d %ld\t%1023[^\t]\t%1023[^\n]"

#endif
