// SPDX-License-Identifier: Apache-2.0
// A directory on a real disk that stays reachable inside the sandbox, where everything else is memory.
#include "diskDirectory.h"

#include "pairedMeasurement.h"
#include "sandbox.h"

#include <linux/magic.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/vfs.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>

namespace fs = std::filesystem;

namespace veldbench {

DiskDirectory::DiskDirectory(const std::string &parent) : m_path(parent + "/bench-store.XXXXXX") {
    if (mkdtemp(m_path.data()) == nullptr) {
        m_path.clear();
        return;
    }
    // A sandbox puts a layer of memory over the machine's root file system; what is a mount of its own shows through.
    m_bound = geteuid() == 0 && unshare(CLONE_NEWNS) == 0 &&
              mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0 &&
              mount(m_path.c_str(), m_path.c_str(), nullptr, MS_BIND, nullptr) == 0;
}

DiskDirectory::~DiskDirectory() {
    if (m_bound) {
        umount2(m_path.c_str(), MNT_DETACH);
    }
    std::error_code ignored;
    if (!m_path.empty()) {
        fs::remove_all(m_path, ignored);
    }
}

bool DiskDirectory::available(std::string &reason) const {
    struct statfs info = {};
    if (m_path.empty() || statfs(m_path.c_str(), &info) != 0) {
        reason = "no directory could be made there";
        return false;
    }
    switch (info.f_type) {
    case TMPFS_MAGIC:
    case RAMFS_MAGIC:
    case OVERLAYFS_SUPER_MAGIC:
        reason = "the file system there is in memory, or layered";
        return false;
    default:
        return true;
    }
}

void DiskDirectory::mountAt(const std::string &target) const {
    veldtest::requireSandbox("mount over " + target);
    require(mount(m_path.c_str(), target.c_str(), nullptr, MS_BIND, nullptr) == 0,
            "mount " + m_path + " on " + target + ": " + std::strerror(errno));
}

void DiskDirectory::unmountFrom(const std::string &target) {
    veldtest::requireSandbox("unmount " + target);
    umount2(target.c_str(), MNT_DETACH);
}

}  // namespace veldbench
