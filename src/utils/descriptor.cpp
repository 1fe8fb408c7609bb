// SPDX-License-Identifier: Apache-2.0
// Owned file descriptors, and reading and writing them to the end.
#include "utils/descriptor.h"

#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>

namespace FW {

namespace {

constexpr size_t READ_SIZE = 65536;

}  // namespace

bool Descriptor::close() {
    const int closing = fd;
    fd = -1;
    return closing < 0 || ::close(closing) == 0;
}

bool readAll(int fd, std::string &text, size_t limit) {
    struct stat status = {};
    if (fstat(fd, &status) == 0 && status.st_size > 0) {
        if (static_cast<size_t>(status.st_size) > limit) {
            errno = EFBIG;
            return false;
        }
        text.reserve(static_cast<size_t>(status.st_size));
    }
    std::array<char, READ_SIZE> chunk;
    for (;;) {
        const ssize_t length = read(fd, chunk.data(), chunk.size());
        if (length == 0) {
            return true;
        }
        if (length < 0) {
            if (errno != EINTR) {
                return false;
            }
            continue;
        }
        text.append(chunk.data(), static_cast<size_t>(length));
        if (text.size() > limit) {
            errno = EFBIG;
            return false;
        }
    }
}

bool writeAll(int fd, const std::string &text) {
    size_t written = 0;
    while (written < text.size()) {
        const ssize_t length = write(fd, text.data() + written, text.size() - written);
        if (length >= 0) {
            written += static_cast<size_t>(length);
        } else if (errno != EINTR) {
            return false;
        }
    }
    return true;
}

}  // namespace FW
