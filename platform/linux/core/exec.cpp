// SPDX-License-Identifier: Apache-2.0
// VLIBCExecv(): running a program, with the reason of a failure in the system log.
#include "core/runProgram.h"

#include "common/childProcess.h"
#include "common/growingPause.h"
#include "common/log.h"

#include <sys/wait.h>

namespace veld {
namespace {

constexpr std::chrono::seconds kBusyTime{10};
// Exit status of an xtables program that finds the tables' lock taken.
constexpr int kXtablesBusy = 4;

}  // namespace

bool isXtablesProgram(const char *path) {
    const char *slash = strrchr(path, '/');
    const std::string_view name = slash != nullptr ? slash + 1 : path;
    for (const std::string_view start : {"iptables", "ip6tables", "xtables"}) {
        if (name.substr(0, start.size()) == start)
            return true;
    }
    return false;
}

int runProgram(const char *path, char *const argv[], std::chrono::milliseconds busyTime) {
    const bool mayBeBusy = isXtablesProgram(path);
    Clock::time_point deadline{};
    GrowingPause pause(std::chrono::milliseconds(10), std::chrono::milliseconds(500));
    for (int attempt = 1;; ++attempt) {
        ErrorOutput errorOutput = ErrorOutput::create();
        if (errorOutput.descriptor() < 0)
            VELD_LOG(LOG_WARNING, "%s: its standard error cannot be kept: %s", commandLine(path, argv).c_str(),
                     errorText(errno).c_str());
        SpawnRequest request;
        request.path = path;
        request.arguments = argv;
        request.standardError = errorOutput.descriptor();
        pid_t process = -1;
        if (const int error = spawnProcess(request, process); error != 0) {
            VELD_LOG(LOG_ERR, "%s: cannot be started: %s", commandLine(path, argv).c_str(),
                     describeStartError(error).c_str());
            VELD_SET_ERROR(systemErrorCode(error));
            errno = error;
            return -1;
        }
        int status = 0;
        const int waitError = waitForProcess(process, status);
        errorOutput.finish();
        if (waitError == 0 && status == 0) {
            if (!errorOutput.empty())
                errorOutput.log(LOG_WARNING, commandLine(path, argv));
            if (attempt > 1)
                VELD_LOG(LOG_NOTICE, "%s: succeeded at try %d, the tables were in use", commandLine(path, argv).c_str(),
                         attempt);
            return 0;
        }
        if (mayBeBusy && waitError == 0 && WIFEXITED(status) && WEXITSTATUS(status) == kXtablesBusy) {
            if (attempt == 1)
                deadline = Clock::now() + busyTime;
            if (pause.sleepUntil(deadline))
                continue;
        }
        const std::string command = commandLine(path, argv);
        errorOutput.log(LOG_ERR, command);
        if (waitError != 0)
            VELD_LOG(LOG_ERR, "%s: its exit status is lost: %s%s", command.c_str(), errorText(waitError).c_str(),
                     waitError == ECHILD ? " (does the calling program ignore SIGCHLD?)" : "");
        else
            VELD_LOG(LOG_ERR, "%s: %s%s", command.c_str(), describeStatus(status).c_str(),
                     attempt > 1 ? " at every try" : "");
        VELD_SET_ERROR(waitError != 0 ? systemErrorCode(waitError) : kInternalError);
        return -1;
    }
}

// A process in between starts the program and ends at once, so that the program becomes a child of init: it can leave
// no zombie, and no thread has to wait for it.
int startProgram(const char *path, char *const argv[]) {
    SpawnRequest request;
    request.path = path;
    request.arguments = argv;
    int error = 0;
    const pid_t between = fork();
    if (between == 0) {
        pid_t process = -1;
        _exit(spawnProcess(request, process));
    }
    if (between < 0) {
        error = errno;
    } else {
        int status = 0;
        error = waitForProcess(between, status);
        if (error == 0)
            error = WIFEXITED(status) ? WEXITSTATUS(status) : EINTR;
        else if (error == ECHILD)
            error = 0;  // The caller ignores SIGCHLD; whether the start succeeded cannot be told then.
    }
    if (error == 0)
        return 0;
    VELD_LOG(LOG_ERR, "%s: cannot be started: %s", commandLine(path, argv).c_str(), describeStartError(error).c_str());
    VELD_SET_ERROR(systemErrorCode(error));
    return -1;
}

}  // namespace veld

int VLIBCExecv(const char *path, char *const argv[], int wait) {
    return veld::guarded(__func__, -1, [&] {
        if (path == nullptr || argv == nullptr || argv[0] == nullptr) {
            VELD_LOG(LOG_ERR, "bad parameters: no program or no arguments");
            VELD_SET_ERROR(veld::kBadParameter);
            return -1;
        }
        return wait != 0 ? veld::runProgram(path, argv, veld::kBusyTime) : veld::startProgram(path, argv);
    });
}
