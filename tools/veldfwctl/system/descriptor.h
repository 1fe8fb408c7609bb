// SPDX-License-Identifier: Apache-2.0
// A file descriptor that is closed in the end.
#ifndef VELDFWCTL_DESCRIPTOR_H
#define VELDFWCTL_DESCRIPTOR_H

#include <unistd.h>

#include <utility>

namespace veldfwctl {

class Descriptor {
public:
    explicit Descriptor(int number = -1) : m_number(number) {}
    ~Descriptor() {
        if (m_number >= 0) {
            close(m_number);
        }
    }
    Descriptor(Descriptor &&other) noexcept : m_number(std::exchange(other.m_number, -1)) {}
    Descriptor &operator=(Descriptor &&other) noexcept {
        std::swap(m_number, other.m_number);
        return *this;
    }
    Descriptor(const Descriptor &) = delete;
    Descriptor &operator=(const Descriptor &) = delete;

    int number() const { return m_number; }
    bool isOpen() const { return m_number >= 0; }

private:
    int m_number;
};

}  // namespace veldfwctl

#endif
