// SPDX-License-Identifier: Apache-2.0
// Puts a recording program in the place of /sbin/iptables and /sbin/ip6tables.
#ifndef VELD_TEST_COMMAND_RECORDER_H
#define VELD_TEST_COMMAND_RECORDER_H

#include <string>
#include <vector>

namespace veldtest {

/// One run of a recorded program.
struct RecordedCommand {
    std::string program;                 ///< the path it was started as (argv[0])
    std::vector<std::string> arguments;  ///< without the program
    std::vector<int> inheritedHandles;   ///< open descriptors above 2 at its start
    /// Program and arguments joined by single blanks.
    std::string line() const;
};

/// While it lives, the programs record each run and exit with 0 unless told otherwise. One at a time.
class CommandRecorder {
public:
    /// @param programs absolute paths to replace
    explicit CommandRecorder(std::vector<std::string> programs = {"/sbin/iptables", "/sbin/ip6tables"});
    ~CommandRecorder();  ///< puts back what was there
    CommandRecorder(const CommandRecorder &) = delete;
    CommandRecorder &operator=(const CommandRecorder &) = delete;

    /// Lets the n-th run (from 1, over all programs, counted since the last clear()) fail.
    void failAt(unsigned n, int status = 1, const std::string &errorText = "");
    /// Lets every run fail whose line() holds `part`. The first rule that applies counts.
    void failMatching(const std::string &part, int status = 1, const std::string &errorText = "");
    /// Lets every run last this long (less than a second), after it was recorded.
    void setDelay(unsigned milliseconds);

    /// All runs in the order of their starts.
    std::vector<RecordedCommand> commands() const;
    /// The line() of each.
    std::vector<std::string> lines() const;
    /// Forgets the runs, the failures and the delay.
    void clear();

private:
    void addRule(unsigned run, int status, unsigned milliseconds, const std::string &part,
                 const std::string &errorText);

    std::vector<std::string> m_programs;
};

}  // namespace veldtest

#endif
