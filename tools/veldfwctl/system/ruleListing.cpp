// SPDX-License-Identifier: Apache-2.0
// Rules as iptables lists them: those in the kernel, and what a plan would look like there.
#include "system/ruleListing.h"

#include <sched.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <exception>
#include <filesystem>
#include <iterator>
#include <thread>

#include "frame/errors.h"
#include "model/restoreText.h"
#include "system/program.h"

namespace veldfwctl {

namespace {

std::string programName(bool isV6) {
    return isV6 ? "ip6tables" : "iptables";
}

/// The restore program that belongs to /sbin/iptables: a machine can have iptables of one backend and iptables-restore
/// of the other, and each sees only its own rules.
std::vector<std::string> restoreProgram(bool isV6) {
    const std::string path = "/sbin/" + programName(isV6);
    std::error_code error;
    const std::filesystem::path real = std::filesystem::canonical(path, error);
    const std::string file = real.filename();
    if (!error && file.rfind("xtables-", 0) == 0 && file.find("-multi") != std::string::npos) {
        return {real.string(), programName(isV6) + "-restore"};
    }
    return {path + "-restore"};
}

}  // namespace

std::string liveListing(bool isV6) {
    return programRequire({"/sbin/" + programName(isV6), "-w", "-S"});
}

std::string plannedListing(const std::vector<std::string> &commands, bool isV6) {
    // Rules of other tables are not listed, and their chains are missing in a network of its own.
    std::vector<std::string> filterCommands;
    std::copy_if(commands.begin(), commands.end(), std::back_inserter(filterCommands),
                 [](const std::string &command) { return commandWordsSplit(command).table == "filter"; });
    const std::string text = restoreTextWrite(filterCommands);
    std::string listing;
    std::exception_ptr failure;
    // A namespace belongs to a thread, and what the thread starts is in it too.
    std::thread([&] {
        try {
            if (unshare(CLONE_NEWNET) != 0) {
                throw Failure(std::string("Cannot make a network namespace to try the rules in: ") +
                              std::strerror(errno) + "; run veldfwctl as root");
            }
            std::vector<std::string> restore = restoreProgram(isV6);
            restore.insert(restore.end(), {"--noflush", "-w"});
            programRequire(restore, text);
            listing = liveListing(isV6);
        } catch (...) {
            failure = std::current_exception();
        }
    }).join();
    if (failure) {
        std::rethrow_exception(failure);
    }
    return listing;
}

}  // namespace veldfwctl
