// SPDX-License-Identifier: Apache-2.0
// Starting programs without a shell, waiting for them, and keeping what they write to standard error.
#include "common/childProcess.h"

#include "common/log.h"

#include <algorithm>
#include <csignal>
#include <fcntl.h>
#include <spawn.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/wait.h>

namespace veld {
namespace {

// Enough for any diagnosis; a program that writes more is not quoted in full.
constexpr std::size_t kKeptErrorOutput = std::size_t{64} * 1024;

class FileActions {
public:
    FileActions() { error_ = posix_spawn_file_actions_init(&actions_); }
    ~FileActions() { posix_spawn_file_actions_destroy(&actions_); }
    FileActions(const FileActions &) = delete;
    FileActions &operator=(const FileActions &) = delete;

    void duplicate(int from, int to) { add(posix_spawn_file_actions_adddup2(&actions_, from, to)); }
    void openNull(int fd) { add(posix_spawn_file_actions_addopen(&actions_, fd, "/dev/null", O_RDWR, 0)); }
    void closeFrom(int fd) { add(posix_spawn_file_actions_addclosefrom_np(&actions_, fd)); }
    int error() const { return error_; }
    const posix_spawn_file_actions_t *get() const { return &actions_; }

private:
    void add(int error) { error_ = error_ != 0 ? error_ : error; }

    posix_spawn_file_actions_t actions_;
    int error_ = 0;
};

class Attributes {
public:
    explicit Attributes(bool ownProcessGroup) {
        posix_spawnattr_init(&attributes_);
        sigset_t signals;
        sigfillset(&signals);
        posix_spawnattr_setsigdefault(&attributes_, &signals);
        sigemptyset(&signals);
        posix_spawnattr_setsigmask(&attributes_, &signals);
        int flags = POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETSIGMASK;
        if (ownProcessGroup)
            flags |= POSIX_SPAWN_SETPGROUP;
        posix_spawnattr_setflags(&attributes_, static_cast<short>(flags));
    }
    ~Attributes() { posix_spawnattr_destroy(&attributes_); }
    Attributes(const Attributes &) = delete;
    Attributes &operator=(const Attributes &) = delete;

    const posix_spawnattr_t *get() const { return &attributes_; }

private:
    posix_spawnattr_t attributes_;
};

}  // namespace

int spawnProcess(const SpawnRequest &request, pid_t &process) noexcept {
    const int streams[] = {request.standardInput, request.standardOutput, request.standardError};
    FileActions actions;
    int null = -1;  // the standard stream at which /dev/null is already open
    for (int stream = 0; stream < 3; ++stream) {
        if (streams[stream] >= 0) {
            actions.duplicate(streams[stream], stream);
        } else if (null >= 0) {
            actions.duplicate(null, stream);
        } else {
            actions.openNull(stream);
            null = stream;
        }
    }
    // Close-on-exec is not enough: the host program may hold descriptors without it.
    actions.closeFrom(3);
    if (actions.error() != 0)
        return actions.error();
    const Attributes attributes(request.ownProcessGroup);
    char *const *environment = request.environment != nullptr ? request.environment : environ;
    return posix_spawn(&process, request.path, actions.get(), attributes.get(), request.arguments, environment);
}

int waitForProcess(pid_t process, int &status) {
    while (waitpid(process, &status, 0) < 0) {
        if (errno != EINTR)
            return errno;
    }
    return 0;
}

UniqueFd aboveStandardStreams(UniqueFd fd) noexcept {
    if (!fd || fd.get() > 2)
        return fd;
    return UniqueFd(fcntl(fd.get(), F_DUPFD_CLOEXEC, 3));
}

ErrorOutput ErrorOutput::create() noexcept {
    ErrorOutput output;
    output.fd_ = aboveStandardStreams(UniqueFd(memfd_create("standard error", MFD_CLOEXEC | MFD_ALLOW_SEALING)));
    return output;
}

void ErrorOutput::finish() {
    if (!fd_)
        return;
    fcntl(fd_.get(), F_ADD_SEALS, F_SEAL_GROW);
    char first[4096];
    const ssize_t count = pread(fd_.get(), first, sizeof first, 0);
    if (count > 0)
        text_.assign(first, static_cast<std::size_t>(count));
    if (count == static_cast<ssize_t>(sizeof first)) {
        text_.resize(kKeptErrorOutput);
        const ssize_t all = pread(fd_.get(), text_.data(), text_.size(), 0);
        text_.resize(all > 0 ? static_cast<std::size_t>(all) : 0);
        struct stat info {};
        if (fstat(fd_.get(), &info) == 0 && static_cast<std::uint64_t>(info.st_size) > text_.size())
            omitted_ = static_cast<std::uint64_t>(info.st_size) - text_.size();
    }
    fd_.reset();
}

void ErrorOutput::log(int priority, const std::string &prefix) const {
    for (const std::string &line : printableLines(text_))
        VELD_LOG(priority, "%s: %s", prefix.c_str(), line.c_str());
    if (omitted_ > 0)
        VELD_LOG(priority, "%s: (%llu more bytes of standard error are left out)", prefix.c_str(),
                 static_cast<unsigned long long>(omitted_));
}

std::vector<std::string> printableLines(std::string_view text) {
    std::vector<std::string> lines;
    while (!text.empty()) {
        const std::size_t end = std::min(text.find('\n'), text.size());
        std::string line(text.substr(0, end));
        text.remove_prefix(std::min(end + 1, text.size()));
        line.erase(line.find_last_not_of(" \t\r") + 1);
        for (char &c : line) {
            if (c == '\t')
                c = ' ';
            else if (static_cast<unsigned char>(c) < 0x20 || c == 0x7F)
                c = '?';
        }
        if (!line.empty())
            lines.push_back(std::move(line));
    }
    return lines;
}

std::string describeStatus(int status) {
    if (WIFSIGNALED(status)) {
        const char *name = sigabbrev_np(WTERMSIG(status));
        return "was killed by signal " + std::to_string(WTERMSIG(status)) +
               (name != nullptr ? " (" + std::string(name) + ")" : std::string());
    }
    return "exited with status " + std::to_string(WEXITSTATUS(status));
}

std::string commandLine(const char *path, char *const *arguments) {
    std::string line = path;
    for (std::size_t i = 1; arguments[0] != nullptr && arguments[i] != nullptr; ++i)
        line.append(" ").append(arguments[i]);
    return line;
}

std::string describeStartError(int error) {
    std::string text = errorText(error);
    if (access("/dev/null", R_OK | W_OK) != 0)
        text += " (/dev/null, which it gets as standard input: " + errorText(errno) + ")";
    return text;
}

}  // namespace veld
