// SPDX-License-Identifier: Apache-2.0
// A directory on a real disk that stays reachable inside the sandbox, where everything else is memory.
#ifndef VELD_BENCH_DISK_DIRECTORY_H
#define VELD_BENCH_DISK_DIRECTORY_H

#include <string>

namespace veldbench {

class DiskDirectory {
public:
    /// Makes an empty directory below `parent`. Called outside the sandbox, before it. As root this gives the process
    /// mounts of its own.
    explicit DiskDirectory(const std::string &parent);
    /// Removes it.
    ~DiskDirectory();
    DiskDirectory(const DiskDirectory &) = delete;
    DiskDirectory &operator=(const DiskDirectory &) = delete;

    /// Inside the sandbox: whether what is written here reaches a disk. When not, `reason` says why.
    bool available(std::string &reason) const;
    /// Inside the sandbox: shows the directory at `target`, until unmountFrom().
    void mountAt(const std::string &target) const;
    static void unmountFrom(const std::string &target);

private:
    std::string m_path;
    bool m_bound = false;
};

}  // namespace veldbench

#endif
