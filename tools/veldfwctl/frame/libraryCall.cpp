// SPDX-License-Identifier: Apache-2.0
// Calls of the library, with the reasons of failures that it writes to the system log.
#include "frame/libraryCall.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstring>
#include <iostream>
#include <optional>
#include <regex>
#include <system_error>

#include "frame/errors.h"

namespace veldfwctl {

namespace {

constexpr const char *IDENT = "veldfwctl";
constexpr std::chrono::milliseconds WATCH_INTERVAL{50};

/// A file in memory, closed in the end.
class MemoryFile {
public:
    MemoryFile() : m_handle(memfd_create("veldfwctl-log", MFD_CLOEXEC)) {
        if (m_handle < 0) {
            throw std::system_error(errno, std::generic_category(), "memfd_create");
        }
    }
    ~MemoryFile() { close(m_handle); }
    MemoryFile(const MemoryFile &) = delete;
    MemoryFile &operator=(const MemoryFile &) = delete;

    int handle() const { return m_handle; }
    std::string text() const {
        std::string all;
        char buffer[4096];
        ssize_t count = 0;
        while ((count = pread(m_handle, buffer, sizeof buffer, static_cast<off_t>(all.size()))) > 0) {
            all.append(buffer, static_cast<size_t>(count));
        }
        return all;
    }

private:
    int m_handle;
};

/// While it lives, standard error leads to the file, and so does a copy of every message to the system log.
class StandardErrorKept {
public:
    explicit StandardErrorKept(const MemoryFile &file) : m_saved(fcntl(STDERR_FILENO, F_DUPFD_CLOEXEC, 3)) {
        std::cerr.flush();
        dup2(file.handle(), STDERR_FILENO);
        openlog(IDENT, LOG_PID | LOG_PERROR, LOG_USER);
    }
    ~StandardErrorKept() {
        if (m_saved >= 0) {
            dup2(m_saved, STDERR_FILENO);
            close(m_saved);
        } else {
            close(STDERR_FILENO);  // it was closed when the tool was started
        }
        systemLogOpen();
    }
    StandardErrorKept(const StandardErrorKept &) = delete;
    StandardErrorKept &operator=(const StandardErrorKept &) = delete;

private:
    int m_saved;
};

/// Runs the operation; what it throws is a failure with the text of the exception as its reason.
bool run(const std::function<bool()> &operation) {
    try {
        return operation();
    } catch (const std::exception &error) {
        syslog(LOG_ERR, "%s", error.what());
        return false;
    }
}

}  // namespace

void systemLogOpen() {
    openlog(IDENT, LOG_PID, LOG_USER);
    setlogmask(LOG_UPTO(LOG_INFO));  // details of the library's work are no reasons
}

CallResult libraryCall(const std::function<bool()> &operation) {
    const MemoryFile file;
    CallResult result;
    {
        const StandardErrorKept kept(file);
        result.succeeded = run(operation);
    }
    result.messages = logMessagesParse(file.text());
    return result;
}

void require(const std::string &what, const std::string &remedy, const std::function<bool()> &operation) {
    const CallResult result = libraryCall(operation);
    if (!result.succeeded) {
        const std::string reasons = messagesJoin(result.messages);
        throw Failure(what + (reasons.empty() ? "" : ": " + reasons) + (remedy.empty() ? "" : "; " + remedy));
    }
}

CallResult protectedCall(const std::function<bool()> &operation, const std::function<void(int process)> &watch) {
    const MemoryFile file;
    std::cout.flush();
    std::cerr.flush();
    const pid_t process = fork();
    if (process < 0) {
        throw std::system_error(errno, std::generic_category(), "fork");
    }
    if (process == 0) {
        setsid();
        for (const int number : {SIGHUP, SIGINT, SIGTERM, SIGQUIT, SIGPIPE}) {
            std::signal(number, SIG_IGN);
        }
        bool succeeded = false;
        {
            const StandardErrorKept kept(file);
            succeeded = run(operation);
        }
        _exit(succeeded ? STATUS_DONE : STATUS_FAILED);
    }
    const auto handle = static_cast<int>(syscall(SYS_pidfd_open, process, 0));
    int status = 0;
    pid_t ended = 0;
    while ((ended = waitpid(process, &status, WNOHANG)) == 0) {
        pollfd wait = {handle, POLLIN, 0};
        poll(&wait, 1, static_cast<int>(WATCH_INTERVAL.count()));
        watch(process);
    }
    close(handle);
    CallResult result;
    result.messages = logMessagesParse(file.text());
    result.succeeded = ended == process && WIFEXITED(status) && WEXITSTATUS(status) == STATUS_DONE;
    if (ended == process && WIFSIGNALED(status)) {
        result.messages.push_back(std::string("the process that did it was killed by signal ") +
                                  sigdescr_np(WTERMSIG(status)));
    }
    return result;
}

std::string messagesJoin(const std::vector<std::string> &messages) {
    std::string text;
    for (size_t i = 0; i < messages.size(); ++i) {
        const auto here = messages.begin() + static_cast<std::ptrdiff_t>(i);
        if (std::find(messages.begin(), here, messages[i]) == here) {
            text += (text.empty() ? "" : "; ") + messages[i];
        }
    }
    return text;
}

std::vector<std::string> logMessagesParse(const std::string &text) {
    if (text.empty()) {  // as after most calls; to build the expressions takes longer than many a call
        return {};
    }
    static const std::regex start("^veldfwctl(\\[[0-9]+\\])?: ");
    static const std::regex place("^[A-Za-z0-9_.]+:[0-9]+ ");
    std::vector<std::string> messages;
    size_t from = 0;
    while (from < text.size()) {
        const size_t end = std::min(text.find('\n', from), text.size());
        const std::string line = text.substr(from, end - from);
        from = end + 1;
        std::smatch match;
        if (std::regex_search(line, match, start)) {
            messages.push_back(std::regex_replace(match.suffix().str(), place, ""));
        } else if (!line.empty()) {
            if (messages.empty()) {
                messages.push_back(line);
            } else {
                messages.back() += " " + line;
            }
        }
    }
    return messages;
}

}  // namespace veldfwctl
