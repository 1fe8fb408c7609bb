// SPDX-License-Identifier: Apache-2.0
// Where a trial keeps its lock, its record and the socket of its watch: /run/veld.
#include "system/trialPlace.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <syslog.h>

#include <cerrno>
#include <cstring>
#include <fstream>
#include <iterator>
#include <vector>

#include "frame/errors.h"

namespace veldfwctl {

namespace {

constexpr const char *DIRECTORY = "/run/veld";
constexpr const char *LOCK = "/run/veld/try.lock";
constexpr const char *RECORD = "/run/veld/try.json";
constexpr const char *SOCKET = "/run/veld/try.socket";
constexpr mode_t OWNER_ONLY = 0600;
constexpr size_t MESSAGE_SIZE = 16384;

[[noreturn]] void fail(const char *path) {
    const int error = errno;
    throw Failure(std::string("Cannot write ") + path + ": " + std::strerror(error) +
                  "; nothing was changed: run this as root, with room on /run");
}

sockaddr_un socketAddress() {
    sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, SOCKET, sizeof address.sun_path - 1);
    return address;
}

}  // namespace

Descriptor trialLockTake() {
    if (mkdir(DIRECTORY, S_IRWXU) != 0 && errno != EEXIST) {
        fail(DIRECTORY);
    }
    Descriptor lock(open(LOCK, O_RDWR | O_CREAT | O_CLOEXEC, OWNER_ONLY));
    if (!lock.isOpen()) {
        fail(LOCK);
    }
    return flock(lock.number(), LOCK_EX | LOCK_NB) == 0 ? std::move(lock) : Descriptor();
}

std::optional<TrialRecord> trialRecordRead() {
    std::ifstream file(RECORD);
    return trialRecordParse({std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()});
}

Descriptor trialRecordCreate(const TrialRecord &record) {
    const std::string text = trialRecordText(record);
    Descriptor file(open(RECORD, O_RDWR | O_CREAT | O_CLOEXEC, OWNER_ONLY));
    if (!file.isOpen() || pwrite(file.number(), text.data(), text.size(), 0) != static_cast<ssize_t>(text.size())) {
        fail(RECORD);
    }
    return file;
}

void trialRecordWrite(const Descriptor &file, const TrialRecord &record) {
    const std::string text = trialRecordText(record);
    if (pwrite(file.number(), text.data(), text.size(), 0) != static_cast<ssize_t>(text.size())) {
        syslog(LOG_WARNING, "Cannot write %s: %s", RECORD, std::strerror(errno));
    }
}

Descriptor trialSocketListen() {
    Descriptor socket(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
    const sockaddr_un address = socketAddress();
    unlink(SOCKET);
    if (!socket.isOpen() || bind(socket.number(), reinterpret_cast<const sockaddr *>(&address), sizeof address) != 0 ||
        chmod(SOCKET, OWNER_ONLY) != 0 || listen(socket.number(), SOMAXCONN) != 0) {
        fail(SOCKET);
    }
    return socket;
}

void trialSocketRemove() {
    unlink(SOCKET);
}

Descriptor trialSocketConnect() {
    Descriptor socket(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
    const sockaddr_un address = socketAddress();
    return connect(socket.number(), reinterpret_cast<const sockaddr *>(&address), sizeof address) == 0
               ? std::move(socket)
               : Descriptor();
}

bool messageSend(const Descriptor &socket, const std::string &text) {
    const size_t size = std::min(text.size(), MESSAGE_SIZE);
    return send(socket.number(), text.data(), size, MSG_NOSIGNAL) == static_cast<ssize_t>(size);
}

std::optional<std::string> messageReceive(const Descriptor &socket, int milliseconds) {
    pollfd wait = {socket.number(), POLLIN, 0};
    int ready = 0;
    while ((ready = poll(&wait, 1, milliseconds)) < 0 && errno == EINTR) {
    }
    std::vector<char> buffer(MESSAGE_SIZE);
    const ssize_t count = ready == 1 ? recv(socket.number(), buffer.data(), buffer.size(), 0) : 0;
    return count > 0 ? std::optional(std::string(buffer.data(), static_cast<size_t>(count))) : std::nullopt;
}

}  // namespace veldfwctl
