// SPDX-License-Identifier: Apache-2.0
// VLIBCPopen(), VLIBCPclose(): a stream from or to a program.
#include "common/childProcess.h"
#include "common/log.h"

#include <fcntl.h>
#include <memory>
#include <mutex>
#include <sys/wait.h>
#include <unordered_map>

namespace veld {
namespace {

struct PipeProgram {
    pid_t process = -1;
    ErrorOutput errorOutput;
    std::string command;
};

// The programs behind the open streams.
class PipePrograms {
public:
    void add(FILE *stream, PipeProgram program) {
        const std::lock_guard guard(mutex_);
        programs_.insert_or_assign(stream, std::move(program));
    }
    // False when no program belongs to the stream.
    bool take(FILE *stream, PipeProgram &program) {
        const std::lock_guard guard(mutex_);
        const auto found = programs_.find(stream);
        if (found == programs_.end())
            return false;
        program = std::move(found->second);
        programs_.erase(found);
        return true;
    }

private:
    std::mutex mutex_;
    std::unordered_map<FILE *, PipeProgram> programs_;
};

// Never destroyed: a stream may be closed while the process ends.
PipePrograms &pipePrograms() {
    static auto *const programs = new PipePrograms;
    return *programs;
}

FILE *failed(int error) {
    VELD_SET_ERROR(systemErrorCode(error));
    errno = error;
    return nullptr;
}

FILE *openPipe(const char *path, bool reading, const std::vector<char *> &arguments) {
    PipeProgram program;
    program.command = commandLine(path, arguments.data());
    int ends[2];
    if (pipe2(ends, O_CLOEXEC) != 0) {
        const int error = errno;
        VELD_LOG(LOG_ERR, "%s: no pipe: %s", program.command.c_str(), errorText(error).c_str());
        return failed(error);
    }
    UniqueFd own(ends[reading ? 0 : 1]);
    UniqueFd theirs = aboveStandardStreams(UniqueFd(ends[reading ? 1 : 0]));
    program.errorOutput = ErrorOutput::create();
    std::unique_ptr<FILE, int (*)(FILE *)> stream(fdopen(own.get(), reading ? "r" : "w"), fclose);
    if (!theirs || stream == nullptr)
        return failed(errno);
    own.release();  // now the stream's

    SpawnRequest request;
    request.path = path;
    request.arguments = arguments.data();
    (reading ? request.standardOutput : request.standardInput) = theirs.get();
    request.standardError = program.errorOutput.descriptor();
    if (const int error = spawnProcess(request, program.process); error != 0) {
        VELD_LOG(LOG_ERR, "%s: cannot be started: %s", program.command.c_str(), describeStartError(error).c_str());
        return failed(error);
    }
    pipePrograms().add(stream.get(), std::move(program));
    return stream.release();
}

int closePipe(FILE *stream) {
    PipeProgram program;
    if (!pipePrograms().take(stream, program)) {
        VELD_LOG(LOG_ERR, "bad parameter: the stream was not opened by VLIBCPopen()");
        VELD_SET_ERROR(kBadParameter);
        errno = EBADF;
        return -1;
    }
    (void)fclose(stream);
    int status = 0;
    const int error = waitForProcess(program.process, status);
    program.errorOutput.finish();
    const bool succeeded = error == 0 && status == 0;
    program.errorOutput.log(succeeded ? LOG_WARNING : LOG_ERR, program.command);
    if (error != 0) {
        VELD_LOG(LOG_ERR, "%s: its exit status is lost: %s", program.command.c_str(), errorText(error).c_str());
        VELD_SET_ERROR(systemErrorCode(error));
        errno = error;
        return -1;
    }
    if (!succeeded)
        VELD_LOG(LOG_ERR, "%s: %s", program.command.c_str(), describeStatus(status).c_str());
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

}  // namespace
}  // namespace veld

FILE *VLIBCPopen(const char *path, const char *mode, const char *arg, ...) {
    va_list list;
    va_start(list, arg);
    FILE *const stream = veld::guarded(__func__, static_cast<FILE *>(nullptr), [&]() -> FILE * {
        const std::string_view direction = mode != nullptr ? mode : "";
        const bool reading = direction == "r" || direction == "re";
        if (path == nullptr || (!reading && direction != "w" && direction != "we")) {
            VELD_LOG(LOG_ERR, "bad parameters: program %s, mode \"%s\"", path != nullptr ? path : "(none)",
                     mode != nullptr ? mode : "(none)");
            VELD_SET_ERROR(veld::kBadParameter);
            errno = EINVAL;
            return nullptr;
        }
        std::vector<char *> arguments{const_cast<char *>(path)};
        for (const char *next = arg; next != nullptr; next = va_arg(list, const char *))
            arguments.push_back(const_cast<char *>(next));
        arguments.push_back(nullptr);
        return veld::openPipe(path, reading, arguments);
    });
    va_end(list);
    return stream;
}

int VLIBCPclose(FILE *stream) {
    return veld::guarded(__func__, -1, [&] { return veld::closePipe(stream); });
}
