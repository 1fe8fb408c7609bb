// SPDX-License-Identifier: Apache-2.0
// A translation case: what the system looks like, a profile, and the commands that must come out.
#ifndef VELD_TEST_CASE_FILE_H
#define VELD_TEST_CASE_FILE_H

#include <map>
#include <string>
#include <vector>

#include "veldfirewall/fwRecords.h"

namespace veldtest {

/// A service definition as a case gives it.
struct CaseService {
    std::string name;
    bool enabled = true;
    std::map<std::string, std::pair<std::string, std::vector<std::string>>> sides;  ///< "source": {"tcp", ports}
};

/// The words are described in cases/README.md.
struct TranslationCase {
    // the system
    std::vector<std::string> interfaces;
    std::string pppoeInterface;
    bool wireless = false;
    std::vector<CaseService> services;
    bool serviceRegistryEmpty = false;
    std::map<std::string, size_t> geoipFiles;          ///< name to size
    std::map<std::string, std::string> tunnelAnswers;  ///< interface to what the network tool prints
    bool networkToolMissing = false;
    // the call
    bool keepEstablished = false;
    bool hasClient = false;
    std::string client;
    FW::FWPROFILE profile;
    // the outcome
    bool fails = false;
    bool preambleSpelledOut = false;
    std::vector<std::string> log;       ///< "error fwIptables.cpp text", all in order
    std::vector<std::string> toolRuns;  ///< interfaces that the tool is asked about, in order
    bool toolRunsGiven = false;
    std::map<std::string, std::vector<std::string>> commands;  ///< "v4 eth0" to its commands in order
};

/// Reads a case. Throws std::runtime_error that names file and line for what it does not know.
TranslationCase readCase(const std::string &path);

}  // namespace veldtest

#endif
