// SPDX-License-Identifier: Apache-2.0
// Puts a recording program in the place of /sbin/iptables and /sbin/ip6tables.
#include "commandRecorder.h"

#include "caseTable.h"
#include "files.h"
#include "recordingProgram.h"
#include "sandbox.h"

#include <cstdio>
#include <fstream>
#include <sstream>

namespace veldtest {
namespace {

const std::string setAside = ".before-recording";

}  // namespace

std::string RecordedCommand::line() const {
    std::string text = program;
    for (const auto &argument : arguments)
        text += " " + argument;
    return text;
}

CommandRecorder::CommandRecorder(std::vector<std::string> programs) : m_programs(std::move(programs)) {
    requireSandbox("replace programs");
    makeDirectories(RECORDER_DIRECTORY, 0777);
    clear();
    for (const auto &program : m_programs) {
        if (pathExists(program))
            std::rename(program.c_str(), (program + setAside).c_str());
        installProgram(VELD_RECORDING_PROGRAM, program);
    }
}

CommandRecorder::~CommandRecorder() {
    for (const auto &program : m_programs) {
        std::remove(program.c_str());
        if (pathExists(program + setAside))
            std::rename((program + setAside).c_str(), program.c_str());
    }
}

void CommandRecorder::addRule(unsigned run, int status, unsigned milliseconds, const std::string &part,
                              const std::string &errorText) {
    std::ofstream(RECORDER_RULES, std::ios::app)
        << run << ' ' << status << ' ' << milliseconds * 1'000'000 << '\t' << part << "\t=" << errorText << '\n';
}

void CommandRecorder::failAt(unsigned n, int status, const std::string &errorText) {
    addRule(n, status, 0, "/", errorText);
}

void CommandRecorder::failMatching(const std::string &part, int status, const std::string &errorText) {
    addRule(0, status, 0, part, errorText);
}

void CommandRecorder::setDelay(unsigned milliseconds) {
    addRule(0, 0, milliseconds, "/", "");
}

std::vector<RecordedCommand> CommandRecorder::commands() const {
    std::vector<RecordedCommand> result;
    for (const auto &run : split(readFile(RECORDER_RECORD), END_OF_RUN)) {
        const auto fields = split(run, '\0');
        RecordedCommand command{fields.at(1), {fields.begin() + 2, fields.end()}, {}};
        std::istringstream handles(fields[0]);
        for (int handle = -1; handles >> handle;)
            command.inheritedHandles.push_back(handle);
        result.push_back(command);
    }
    return result;
}

std::vector<std::string> CommandRecorder::lines() const {
    std::vector<std::string> result;
    for (const auto &command : commands())
        result.push_back(command.line());
    return result;
}

void CommandRecorder::clear() {
    writeFile(RECORDER_RECORD, "", 0666);
    writeFile(RECORDER_RULES, "", 0666);
}

}  // namespace veldtest
