// SPDX-License-Identifier: Apache-2.0
// What is found out about a machine: plain judgements on what programs and files say.
#ifndef VELDFWCTL_DIAGNOSIS_H
#define VELDFWCTL_DIAGNOSIS_H

#include <set>
#include <string>
#include <vector>

namespace veldfwctl {

enum class Verdict {
    OK,
    NOTE,     ///< worth knowing; nothing has to be done
    PROBLEM,  ///< the firewall does not work, or not as it should
};

struct Diagnosis {
    std::string item;  ///< what was looked at: "programs"
    Verdict verdict = Verdict::OK;
    std::string text;
    std::string mend;  ///< what to do; empty when there is nothing
};

/// "nft" or "legacy", from what "iptables --version" prints; empty when it tells neither.
std::string backendOf(const std::string &version);

/// What a program said about its version.
struct ProgramVersion {
    std::string program;
    std::string error;  ///< why it cannot be run; empty when it can
    std::string version;
};

/// One finding per program that cannot be run, and one about their backends.
std::vector<Diagnosis> programsJudge(const std::vector<ProgramVersion> &programs);

/// Who else has chains or tables.
/// @param listings what "iptables -S" and "ip6tables -S" print
/// @param nftTables what "nft list tables" prints; may be empty
std::vector<Diagnosis> othersJudge(const std::vector<std::string> &listings, const std::string &nftTables,
                                   const std::string &backend);

/// Modules that are neither loaded nor can be. Names may have the extension ".ko".
/// @param loaded names as /proc/modules has them
/// @param available lines of modules.dep and modules.builtin
std::vector<std::string> modulesMissing(const std::vector<std::string> &wanted, const std::set<std::string> &loaded,
                                        const std::vector<std::string> &available);

}  // namespace veldfwctl

#endif
