// SPDX-License-Identifier: Apache-2.0
// A hook is a directory; running it runs the executables in it.
#include "sdk/hookDirectory.h"

#include "common/childProcess.h"
#include "common/growingPause.h"
#include "common/log.h"

#include <algorithm>
#include <csignal>
#include <dirent.h>
#include <memory>
#include <sys/stat.h>
#include <sys/wait.h>

namespace veld {
namespace {

// Waits for the process, and kills it with its group at the deadline: 0 and its status, or an errno value.
int waitOrKill(pid_t process, Clock::time_point deadline, int &status, bool &killed) {
    GrowingPause pause(std::chrono::microseconds(500), std::chrono::milliseconds(10));
    for (;;) {
        const pid_t ended = waitpid(process, &status, WNOHANG);
        if (ended == process)
            return 0;
        if (ended < 0 && errno != EINTR)
            return errno;
        if (!pause.sleepUntil(deadline)) {
            // Not collected yet, so that both numbers still mean this process.
            killed = true;
            kill(-process, SIGKILL);
            kill(process, SIGKILL);
            return waitForProcess(process, status);
        }
    }
}

bool runHookProgram(const std::string &path, const char *argument, char *const *environment,
                    std::chrono::milliseconds time) {
    const std::string command = path + " " + argument;
    ErrorOutput errorOutput = ErrorOutput::create();
    char *const arguments[] = {const_cast<char *>(path.c_str()), const_cast<char *>(argument), nullptr};
    SpawnRequest request;
    request.path = path.c_str();
    request.arguments = arguments;
    request.environment = environment;
    request.standardError = errorOutput.descriptor();
    request.ownProcessGroup = true;
    pid_t process = -1;
    if (const int error = spawnProcess(request, process); error != 0) {
        VELD_LOG(LOG_ERR, "hook %s: cannot be started: %s", command.c_str(), describeStartError(error).c_str());
        return false;
    }
    int status = 0;
    bool killed = false;
    const int error = waitOrKill(process, Clock::now() + time, status, killed);
    errorOutput.finish();
    const bool succeeded = error == 0 && status == 0 && !killed;
    errorOutput.log(succeeded ? LOG_WARNING : LOG_ERR, "hook " + command);
    if (killed)
        VELD_LOG(LOG_ERR, "hook %s: still ran after %lld ms and was killed", command.c_str(),
                 static_cast<long long>(time.count()));
    else if (error != 0)
        VELD_LOG(LOG_ERR, "hook %s: its exit status is lost: %s%s", command.c_str(), errorText(error).c_str(),
                 error == ECHILD ? " (does the calling program ignore SIGCHLD?)" : "");
    else if (!succeeded)
        VELD_LOG(LOG_ERR, "hook %s: %s", command.c_str(), describeStatus(status).c_str());
    return succeeded;
}

}  // namespace

bool isHookName(const std::string &name) {
    if (name.empty() || name.front() == '/')
        return false;
    for (std::size_t begin = 0; begin <= name.size();) {
        const std::size_t end = std::min(name.find('/', begin), name.size());
        // No component may be empty or begin with a dot, "." and ".." above all.
        if (end == begin || name[begin] == '.')
            return false;
        begin = end + 1;
    }
    return true;
}

std::vector<std::string> environmentWith(const char *const *base, const std::map<std::string, std::string> &arguments) {
    std::vector<std::string> environment;
    for (; base != nullptr && *base != nullptr; ++base) {
        const std::string_view variable = *base;
        if (arguments.count(std::string(variable.substr(0, variable.find('=')))) == 0)
            environment.emplace_back(variable);
    }
    for (const auto &[key, value] : arguments)
        environment.push_back(key + "=" + value);
    return environment;
}

int listExecutables(const std::string &directory, std::vector<std::string> &paths) {
    paths.clear();
    const std::unique_ptr<DIR, int (*)(DIR *)> stream(opendir(directory.c_str()), closedir);
    if (stream == nullptr)
        return errno == ENOENT ? 0 : errno;
    errno = 0;
    while (const dirent *entry = readdir(stream.get())) {
        std::string path = directory;
        path.append("/").append(entry->d_name);
        struct stat info {};
        if (entry->d_name[0] != '.' && stat(path.c_str(), &info) == 0 && S_ISREG(info.st_mode) &&
            access(path.c_str(), X_OK) == 0)
            paths.push_back(path);
        errno = 0;
    }
    const int error = errno;
    std::sort(paths.begin(), paths.end());
    return error;
}

bool runHookDirectory(const std::string &directory, const char *argument,
                      const std::map<std::string, std::string> &arguments, std::chrono::milliseconds time) {
    std::vector<std::string> paths;
    if (const int error = listExecutables(directory, paths); error != 0) {
        VELD_LOG(LOG_ERR, "hook directory %s: %s", directory.c_str(), errorText(error).c_str());
        return false;
    }
    std::vector<std::string> variables = environmentWith(environ, arguments);
    std::vector<char *> environment;
    environment.reserve(variables.size() + 1);
    for (std::string &variable : variables)
        environment.push_back(variable.data());
    environment.push_back(nullptr);
    bool succeeded = true;
    for (const std::string &path : paths)
        succeeded = runHookProgram(path, argument, environment.data(), time) && succeeded;
    return succeeded;
}

}  // namespace veld
