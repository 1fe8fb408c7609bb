// SPDX-License-Identifier: Apache-2.0
// The process that ends a trial.
#include "system/trialWatch.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/signalfd.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <syslog.h>

#include <algorithm>
#include <csignal>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <thread>
#include <vector>

#include "frame/errors.h"
#include "frame/libraryCall.h"
#include "system/trialPlace.h"
#include "system/trialSteps.h"

namespace veldfwctl {

namespace {

constexpr const char *KEEP = "keep";
constexpr const char *TAKE_BACK = "take back";
constexpr const char *NOT_BEGUN = "it could not begin";
constexpr int REQUEST_MILLISECONDS = 1000;  // a client that connects has its request ready
constexpr std::chrono::milliseconds POLL_INTERVAL{50};
constexpr int64_t MILLI = 1000;

/// Goes on while the machine sleeps, and no clock setting moves it.
int64_t nowMilliseconds() {
    timespec now = {};
    clock_gettime(CLOCK_BOOTTIME, &now);
    return now.tv_sec * MILLI + now.tv_nsec / 1000000;
}

/// Answers start with '+' for done, '-' for failed.
std::string answer(bool succeeded, const std::string &text) {
    return (succeeded ? "+" : "-") + text;
}

class Watch {
public:
    Watch(TrialRequest request, TrialRecord record, TrialReturn before, Descriptor file)
        : m_request(std::move(request)), m_record(std::move(record)), m_before(std::move(before)),
          m_file(std::move(file)) {}

    /// @param starter is told how the start went
    void run(const Descriptor &starter) {
        Descriptor socket;
        try {
            socket = trialSocketListen();
        } catch (const Failure &failure) {
            trialForget(m_record);
            end(TrialPhase::TAKEN_BACK, NOT_BEGUN);
            messageSend(starter, answer(false, failure.what()));
            return;
        }
        m_record.watch = getpid();
        trialRecordWrite(m_file, m_record);
        const int64_t start = nowMilliseconds();
        const CallResult applied = trialApply(m_record, m_request.client);
        if (!applied.succeeded) {
            const std::string reason =
                "Cannot apply profile \"" + m_record.profile + "\": " + messagesJoin(applied.messages) + "; ";
            messageSend(starter, answer(false, reason + takeBack("it could not be applied", false)));
            return;
        }
        const int64_t now = nowMilliseconds();
        const int64_t deadline = now + m_request.seconds * MILLI;
        m_record.phase = TrialPhase::ON_TRIAL;
        m_record.until = std::time(nullptr) + m_request.seconds;
        trialRecordWrite(m_file, m_record);
        messageSend(starter, answer(true, std::to_string(m_record.atomic ? 0 : now - start)));
        serve(socket, deadline);
    }

private:
    void serve(const Descriptor &socket, int64_t deadline) {
        sigset_t termination;
        sigemptyset(&termination);
        sigaddset(&termination, SIGTERM);
        const Descriptor signals(signalfd(-1, &termination, SFD_CLOEXEC));
        while (isOpen(m_record.phase)) {
            const int64_t left = deadline - nowMilliseconds();
            if (left <= 0) {
                takeBack("it was not confirmed in time", true);
                return;
            }
            pollfd waits[] = {{socket.number(), POLLIN, 0}, {signals.number(), POLLIN, 0}};
            // Wakes up now and then: poll() does not count the time that the machine sleeps.
            poll(waits, 2, static_cast<int>(std::min(left, MILLI)));
            if ((waits[1].revents & POLLIN) != 0) {
                takeBack("its watch was told to stop", true);
            } else if ((waits[0].revents & POLLIN) != 0) {
                const Descriptor client(accept4(socket.number(), nullptr, nullptr, SOCK_CLOEXEC));
                const std::string request = messageReceive(client, REQUEST_MILLISECONDS).value_or("");
                if (request == KEEP) {
                    keep(client);
                } else if (request == TAKE_BACK) {
                    const std::string text = takeBack("as asked for", true);
                    messageSend(client, answer(m_record.phase == TrialPhase::TAKEN_BACK, text));
                }
            }
        }
    }

    void keep(const Descriptor &client) {
        const CallResult adopted = trialAdopt(m_record);
        if (!adopted.succeeded) {
            messageSend(client, answer(false, "Cannot keep profile \"" + m_record.profile +
                                                  "\": " + messagesJoin(adopted.messages) +
                                                  "; it stays on trial: mend that and confirm again in time"));
            return;
        }
        const CallResult enforced = trialEnforce(m_record);
        if (enforced.succeeded) {
            const std::string text =
                "Profile \"" + m_record.profile + "\" is kept: it is the active one, and in force.";
            end(TrialPhase::KEPT, text);
            messageSend(client, answer(true, text));
            return;
        }
        const std::string reason =
            "Cannot keep profile \"" + m_record.profile + "\": " + messagesJoin(enforced.messages) + "; ";
        messageSend(client, answer(false, reason + takeBack("it could not be kept", false)));
    }

    /// Puts back what was before. @return what was done
    std::string takeBack(const std::string &why, bool applied) {
        const CallResult result = trialTakeBack(m_record, m_before, applied);
        std::string text = "Profile \"" + m_record.profile + "\" was taken back (" + why + "); " +
                           (m_before.wasEnabled ? "profile \"" + m_before.previous + "\" is in force."
                                                : "the firewall is off, as before.");
        if (!result.succeeded) {
            text = "What was before the trial of profile \"" + m_record.profile +
                   "\" could not be put back: " + messagesJoin(result.messages) + "; run \"veldfwctl reload\"";
        }
        syslog(result.succeeded ? LOG_NOTICE : LOG_ERR, "%s", text.c_str());
        end(result.succeeded ? TrialPhase::TAKEN_BACK : TrialPhase::FAILED, text);
        return text;
    }

    void end(TrialPhase phase, const std::string &text) {
        m_record.phase = phase;
        m_record.text = text;
        trialRecordWrite(m_file, m_record);
        trialSocketRemove();
    }

    TrialRequest m_request;
    TrialRecord m_record;
    TrialReturn m_before;
    Descriptor m_file;
};

/// Cuts the process off from everything that it was started with but the descriptors to keep.
void detach(const std::vector<int> &keep) {
    closelog();
    const Descriptor null(open("/dev/null", O_RDWR | O_CLOEXEC));
    for (const int standard : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
        dup2(null.number(), standard);
    }
    std::vector<int> open;
    for (const auto &entry : std::filesystem::directory_iterator("/proc/self/fd")) {
        open.push_back(std::stoi(entry.path().filename()));
    }
    for (const int number : open) {
        if (number > STDERR_FILENO && number != null.number() &&
            std::find(keep.begin(), keep.end(), number) == keep.end()) {
            close(number);
        }
    }
    if (chdir("/") != 0) {
        syslog(LOG_WARNING, "Cannot leave the working directory");
    }
    prctl(PR_SET_NAME, "veldfwctl-try");
    for (const int number : {SIGHUP, SIGINT, SIGQUIT, SIGPIPE}) {
        std::signal(number, SIG_IGN);
    }
    sigset_t termination;
    sigemptyset(&termination);
    sigaddset(&termination, SIGTERM);
    sigprocmask(SIG_BLOCK, &termination, nullptr);
    // Memory pressure must not end the one process that opens the door again. Without the right to ask for that: so be
    // it.
    std::ofstream("/proc/self/oom_score_adj") << "-1000";
    systemLogOpen();
}

/// The state of a trial whose watch is gone.
std::string abandonedEnd(const Descriptor &lock, TrialRecord record, bool keep) {
    if (keep) {
        throw Failure("The watch of the trial of profile \"" + record.profile +
                      "\" is gone; run \"veldfwctl try --revert\"");
    }
    if (!lock.isOpen()) {
        throw Failure("The watch of the trial does not answer; run \"veldfwctl doctor\" to see what it waits for");
    }
    const TrialReturn before{record.previous, record.wasEnabled, {}};
    const CallResult result = trialTakeBack(record, before, true);
    record.phase = result.succeeded ? TrialPhase::TAKEN_BACK : TrialPhase::FAILED;
    record.text = result.succeeded ? "Profile \"" + record.profile + "\" was taken back (its watch was gone)."
                                   : messagesJoin(result.messages);
    trialRecordWrite(trialRecordCreate(record), record);
    if (!result.succeeded) {
        throw Failure("Cannot put back what was before the trial: " + record.text + "; run \"veldfwctl reload\"");
    }
    return record.text;
}

/// Waits for the lock of a watch that is about to end.
Descriptor lockAwait() {
    Descriptor lock = trialLockTake();
    for (int i = 0; i < 100 && !lock.isOpen(); ++i) {
        std::this_thread::sleep_for(POLL_INTERVAL);
        lock = trialLockTake();
    }
    return lock;
}

}  // namespace

std::chrono::milliseconds trialStart(const TrialRequest &request) {
    const Descriptor lock = trialLockTake();
    if (!lock.isOpen()) {
        throw Failure("Another trial is under way; end it with \"veldfwctl try --confirm\" or \"try --revert\"");
    }
    TrialRecord record;
    record.profile = request.profile;
    record.atomic = request.atomic;
    record.phase = TrialPhase::TAKEN_BACK;
    record.text = NOT_BEGUN;
    Descriptor file = trialRecordCreate(record);
    TrialReturn before = trialPrepare(request.profile);
    record.previous = before.previous;
    record.wasEnabled = before.wasEnabled;
    record.phase = TrialPhase::APPLYING;
    record.text.clear();
    trialRecordWrite(file, record);
    int ends[2] = {-1, -1};
    if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends) != 0) {
        throw Failure("Cannot talk to a watch: no socket; nothing was changed");
    }
    const Descriptor mine(ends[0]);
    Descriptor its(ends[1]);
    std::cout.flush();
    std::cerr.flush();
    const pid_t middle = fork();
    if (middle < 0) {
        throw Failure("Cannot start a watch; nothing was changed");
    }
    if (middle == 0) {
        setsid();
        if (fork() == 0) {
            detach({lock.number(), file.number(), its.number()});
            Watch(request, record, std::move(before), std::move(file)).run(its);
        }
        _exit(STATUS_DONE);
    }
    waitpid(middle, nullptr, 0);
    its = Descriptor();
    const std::optional<std::string> report = messageReceive(mine);
    if (!report) {
        throw Failure("The watch of the trial has ended without a word; run \"veldfwctl try --revert\"");
    }
    if (report->front() != '+') {
        throw Failure(report->substr(1));
    }
    return std::chrono::milliseconds(std::stoll(report->substr(1)));
}

std::string trialEnd(bool keep) {
    const Descriptor watch = trialSocketConnect();
    if (watch.isOpen() && messageSend(watch, keep ? KEEP : TAKE_BACK)) {
        if (const std::optional<std::string> reply = messageReceive(watch)) {
            if (reply->front() != '+') {
                throw Failure(reply->substr(1));
            }
            return reply->substr(1);
        }
    }
    const Descriptor lock = lockAwait();
    const std::optional<TrialRecord> record = trialRecordRead();
    if (record && isOpen(record->phase)) {
        return abandonedEnd(lock, *record, keep);
    }
    throw Failure("There is no trial" + (record ? "; the last one: " + record->text : ""));
}

}  // namespace veldfwctl
