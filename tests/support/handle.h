// SPDX-License-Identifier: Apache-2.0
// An owned file descriptor, and the error of a system call as an exception.
#ifndef VELD_TEST_HANDLE_H
#define VELD_TEST_HANDLE_H

#include <unistd.h>

#include <cerrno>
#include <string>
#include <system_error>
#include <utility>

namespace veldtest {

/// errno, and what was tried.
inline std::system_error systemError(const std::string &what, int error = errno) {
    return std::system_error(error, std::generic_category(), what);
}

/// Owns a file descriptor.
class Handle {
public:
    Handle() = default;
    /// @param handle what a system call returned; throws systemError(what) when it is negative
    Handle(int handle, const std::string &what) : m_handle(handle) {
        if (handle < 0)
            throw systemError(what);
    }
    ~Handle() {
        if (m_handle >= 0)
            close(m_handle);
    }
    Handle(Handle &&other) noexcept : m_handle(std::exchange(other.m_handle, -1)) {}
    Handle &operator=(Handle &&other) noexcept {
        std::swap(m_handle, other.m_handle);
        return *this;
    }
    int get() const { return m_handle; }

private:
    int m_handle = -1;
};

}  // namespace veldtest

#endif
