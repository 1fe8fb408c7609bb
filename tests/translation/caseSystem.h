// SPDX-License-Identifier: Apache-2.0
// Makes the sandbox look as a translation case says.
#ifndef VELD_TEST_CASE_SYSTEM_H
#define VELD_TEST_CASE_SYSTEM_H

#include <string>
#include <vector>

#include "caseFile.h"

namespace veldtest {

/// Interfaces, PPPoE link, service definitions, country files and a network tool, for as long as the object lives.
class CaseSystem {
public:
    explicit CaseSystem(const TranslationCase &wanted);
    ~CaseSystem();
    CaseSystem(const CaseSystem &) = delete;
    CaseSystem &operator=(const CaseSystem &) = delete;

    /// The arguments of each run of the network tool.
    static std::vector<std::string> toolRuns();

private:
    std::vector<std::string> m_interfaces;
};

}  // namespace veldtest

#endif
