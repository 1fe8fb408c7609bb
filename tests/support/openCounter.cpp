// SPDX-License-Identifier: Apache-2.0
// Counts how often the files of a directory are opened.
#include "openCounter.h"

#include <sys/inotify.h>
#include <unistd.h>

#include <array>

namespace veldtest {

OpenCounter::OpenCounter(const std::string &directory) : m_handle(inotify_init1(IN_NONBLOCK | IN_CLOEXEC)) {
    inotify_add_watch(m_handle, directory.c_str(), IN_OPEN);
}

OpenCounter::~OpenCounter() {
    close(m_handle);
}

std::map<std::string, int> OpenCounter::take() {
    std::map<std::string, int> counts;
    alignas(inotify_event) std::array<char, 65536> buffer;
    for (ssize_t size = 0; (size = read(m_handle, buffer.data(), buffer.size())) > 0;) {
        for (const char *at = buffer.data(); at < buffer.data() + size;) {
            const auto *event = reinterpret_cast<const inotify_event *>(at);
            if (event->len > 0)  // not the directory itself
                ++counts[event->name];
            at += sizeof(inotify_event) + event->len;
        }
    }
    return counts;
}

}  // namespace veldtest
