// SPDX-License-Identifier: Apache-2.0
// Owned file descriptors, and reading and writing them to the end.
#ifndef VELDFIREWALL_SRC_DESCRIPTOR_H
#define VELDFIREWALL_SRC_DESCRIPTOR_H

#include <cstddef>
#include <string>

namespace FW {

/// A file descriptor that is closed at the end of its scope, unless closed before.
class Descriptor {
public:
    explicit Descriptor(int opened) : fd(opened) {}
    ~Descriptor() { close(); }
    Descriptor(Descriptor &&other) noexcept : fd(other.fd) { other.fd = -1; }
    Descriptor(const Descriptor &) = delete;
    Descriptor &operator=(const Descriptor &) = delete;

    bool isOpen() const { return fd >= 0; }
    int get() const { return fd; }
    /// @return false with errno when closing failed, which may be the report of a failed write
    bool close();

private:
    int fd;
};

/// More than any document or program output has; it bounds what a broken file can do to the reader's memory.
constexpr size_t READ_LIMIT = size_t{256} * 1024 * 1024;

/// Reads everything up to the end of the file into `text`, which is empty before. @return false with errno (EFBIG when
/// there is more than `limit` bytes)
bool readAll(int fd, std::string &text, size_t limit = READ_LIMIT);
/// Writes all of `text`. @return false with errno
bool writeAll(int fd, const std::string &text);

}  // namespace FW

#endif
