// SPDX-License-Identifier: Apache-2.0
// Builds the file system that a sandbox sees: an overlay over "/", or a tmpfs of links where overlays are not allowed.
#include "sandboxRoot.h"

#include "handle.h"

#include <fcntl.h>
#include <mntent.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <system_error>
#include <utility>
#include <vector>

namespace fs = std::filesystem;

namespace veldtest {
namespace {

/// Where the new root is put together; what lies below is reached through descriptors meanwhile.
const std::string staging = "/tmp";
const std::string newRoot = staging + "/root";
/// Where the machine's root stays when the new root consists of links to it.
const std::string hostRoot = "/.host";

/// Directories that are empty in every sandbox.
const std::vector<std::string> freshDirectories = {"/tmp", "/run", "/usr/veld", "/dev"};
/// Directories that the kernel fills.
const std::vector<std::string> kernelDirectories = {"/proc", "/sys"};
/// Directories in which tests create or replace entries, when "/" is a tmpfs of links.
const std::vector<std::string> linkedDirectories = {
    "/",    "/usr",     "/usr/bin",          "/usr/sbin", "/usr/lib", "/usr/share", "/usr/lib/modules", "/etc",
    "/var", "/var/lib", "/etc/alternatives", "/bin",      "/sbin",    "/lib",       "/lib/modules"};

bool mounted(const std::string &source, const std::string &target, const char *type, unsigned long flags,
             const std::string &options = "") {
    return mount(source.c_str(), target.c_str(), type, flags, options.empty() ? nullptr : options.c_str()) == 0;
}

void mountOrThrow(const std::string &source, const std::string &target, const char *type, unsigned long flags,
                  const std::string &options = "") {
    if (!mounted(source, target, type, flags, options))
        throw systemError("mount " + source + " on " + target);
}

void bindOrThrow(const std::string &source, const std::string &target) {
    mountOrThrow(source, target, nullptr, MS_BIND | MS_REC);
}

bool contains(const std::vector<std::string> &list, const std::string &value) {
    return std::find(list.begin(), list.end(), value) != list.end();
}

bool isBelow(const std::string &path, const std::string &directory) {
    return path == directory || directory == "/" || path.compare(0, directory.size() + 1, directory + "/") == 0;
}

bool isBelowAny(const std::string &path, const std::vector<std::string> &directories) {
    return std::any_of(directories.begin(), directories.end(), [&](const auto &d) { return isBelow(path, d); });
}

/// Mount points below "/" that have no other mount point above them.
std::vector<std::string> outermostMountPoints() {
    std::set<std::string> points;  // sorted: what lies above comes first
    std::unique_ptr<FILE, int (*)(FILE *)> mounts(setmntent("/proc/self/mounts", "re"), endmntent);
    while (const auto *entry = mounts ? getmntent(mounts.get()) : nullptr)
        points.insert(entry->mnt_dir);
    std::vector<std::string> outermost;
    for (const auto &point : points) {
        if (point != "/" && !isBelowAny(point, outermost))
            outermost.push_back(point);
    }
    return outermost;
}

/// The entries of fresh directories that lead to the program, the working directory and the build: they must stay
/// visible, and are held open because they will be hidden on the way.
std::map<std::string, Handle> openKeptDirectories() {
    std::error_code ignored;
    std::map<std::string, Handle> kept;
    for (const auto &path : {fs::read_symlink("/proc/self/exe", ignored).string(), fs::current_path(ignored).string(),
                             std::string(VELD_SOURCE_DIR), std::string(VELD_BINARY_DIR)}) {
        for (const auto &fresh : freshDirectories) {
            const std::string entry = path.substr(0, path.find('/', fresh.size() + 1));
            if (isBelow(path, fresh) && path != fresh && fs::is_directory(entry))
                kept[entry] = {open(entry.c_str(), O_PATH | O_CLOEXEC | O_DIRECTORY), "open " + entry};
        }
    }
    return kept;
}

void putBackKeptDirectories(const std::map<std::string, Handle> &kept) {
    for (const auto &[path, handle] : kept) {
        fs::create_directories(newRoot + path);
        bindOrThrow("/proc/self/fd/" + std::to_string(handle.get()), newRoot + path);
    }
}

bool mountOverlayRoot() {
    for (const char *name : {"/upper", "/work", "/root"})
        fs::create_directory(staging + name);
    const std::string layers = "lowerdir=/,upperdir=" + staging + "/upper,workdir=" + staging + "/work";
    if (!mounted("overlay", newRoot, "overlay", 0, layers) &&
        !mounted("overlay", newRoot, "overlay", 0, layers + ",userxattr"))
        return false;
    // An overlay can be mounted and yet refuse to create anything, for example when the ids of files are not mapped.
    const std::string probe = newRoot + "/usr/sbin/.sandbox-probe";
    if (mkdir(probe.c_str(), 0700) != 0) {
        umount2(newRoot.c_str(), MNT_DETACH);
        return false;
    }
    rmdir(probe.c_str());
    return true;
}

/// An overlay shows one mount only: the other mounts of the machine are bound in. Files that are mounts (a container's
/// /etc/hosts) are copied, because a mount point cannot be replaced.
void bindOtherMounts() {
    for (const auto &point : outermostMountPoints()) {
        if (isBelowAny(point, freshDirectories) || isBelowAny(point, kernelDirectories))
            continue;
        std::error_code error;
        const std::string target = newRoot + point;
        if (fs::is_directory(point, error)) {
            if (fs::is_directory(target, error) || fs::create_directories(target, error))
                mounted(point, target, nullptr, MS_BIND | MS_REC);
        } else if (fs::is_regular_file(point, error)) {
            fs::remove(target, error);
            fs::copy_file(point, target, error);
        }
    }
}

/// Fills `path` of the new root with the machine's entries: links as they are, directories of the list as directories,
/// everything else as links to the machine's root.
void linkDirectory(const std::string &path) {
    const std::string prefix = path == "/" ? "/" : path + "/";
    for (const auto &entry : fs::directory_iterator(path)) {
        const std::string source = prefix + entry.path().filename().string();
        const std::string target = newRoot + source;
        if (contains(freshDirectories, source) || contains(kernelDirectories, source) || source == hostRoot)
            continue;
        if (entry.is_symlink()) {
            fs::copy_symlink(source, target);
        } else if (entry.is_directory() && contains(linkedDirectories, source)) {
            fs::create_directory(target);
            linkDirectory(source);
        } else if (entry.is_directory() && path == "/") {
            // Binds rather than links, so that the real path of a program is the same inside and outside.
            fs::create_directory(target);
            mounted(source, target, nullptr, MS_BIND | MS_REC);
        } else {
            fs::create_symlink(hostRoot + source, target);
        }
    }
}

void mountLinkedRoot() {
    fs::create_directories(newRoot);
    mountOrThrow("tmpfs", newRoot, "tmpfs", 0, "mode=755");
    linkDirectory("/");
}

void makePublicDirectory(const std::string &path) {
    fs::create_directories(path);
    fs::permissions(path, fs::perms::all | fs::perms::sticky_bit);
}

void makeDevices() {
    const std::string dev = newRoot + "/dev";
    for (const char *name : {"null", "zero", "full", "random", "urandom", "tty", "net/tun"}) {
        const std::string source = std::string("/dev/") + name;
        if (access(source.c_str(), F_OK) != 0)
            continue;
        const std::string target = dev + "/" + name;
        fs::create_directories(fs::path(target).parent_path());
        const std::ofstream created(target);
        mountOrThrow(source, target, nullptr, MS_BIND);
    }
    for (const auto &[name, target] : {std::pair{"fd", "/proc/self/fd"},
                                       {"stdin", "/proc/self/fd/0"},
                                       {"stdout", "/proc/self/fd/1"},
                                       {"stderr", "/proc/self/fd/2"},
                                       {"ptmx", "pts/ptmx"}})
        fs::create_symlink(target, dev + "/" + name);
    fs::create_directory(dev + "/pts");
    if (!mounted("devpts", dev + "/pts", "devpts", 0, "newinstance,ptmxmode=0666,mode=0620"))
        bindOrThrow("/dev/pts", dev + "/pts");
    makePublicDirectory(dev + "/shm");
}

void mountFreshDirectories() {
    for (const auto &directory : freshDirectories) {
        const std::string target = newRoot + directory;
        fs::create_directories(target);
        mountOrThrow("tmpfs", target, "tmpfs", 0, directory == "/tmp" ? "mode=1777" : "mode=755");
    }
    makePublicDirectory(newRoot + "/run/lock");
    // Usually a link to /run/lock, and then fresh already.
    const std::string oldLocks = newRoot + "/var/lock";
    if (!fs::is_symlink(oldLocks)) {
        fs::create_directories(oldLocks);
        mountOrThrow("tmpfs", oldLocks, "tmpfs", 0, "mode=1777");
    }
    makeDevices();
}

/// A /proc of this pid namespace and a /sys of this network namespace; where the machine hides parts of its own, the
/// kernel allows no new ones, and the machine's are bound in.
void mountKernelDirectories() {
    for (const auto &[directory, type] : {std::pair{"/proc", "proc"}, std::pair{"/sys", "sysfs"}}) {
        const std::string target = newRoot + directory;
        fs::create_directories(target);
        if (!mounted(type, target, type, MS_NOSUID | MS_NODEV | MS_NOEXEC))
            bindOrThrow(directory, target);
    }
}

/// Kernel modules belong to the whole machine: without a list of what is there and what is loaded, none is loaded or
/// removed. The kernel itself still loads what a rule needs.
void hideKernelModules() {
    for (const char *directory : {"/sys/module", "/usr/lib/modules"}) {
        const std::string target = newRoot + directory;
        std::error_code error;
        if (fs::is_directory(target, error))
            mountOrThrow("tmpfs", target, "tmpfs", 0, "mode=755");
    }
}

void switchToNewRoot(bool keepHost) {
    const std::string old = newRoot + hostRoot;
    fs::create_directories(old);
    if (syscall(SYS_pivot_root, newRoot.c_str(), old.c_str()) != 0)
        throw systemError("pivot_root");
    if (chdir("/") != 0)
        throw systemError("chdir /");
    if (keepHost)
        return;
    if (umount2(hostRoot.c_str(), MNT_DETACH) != 0)
        throw systemError("unmount the machine's root");
    rmdir(hostRoot.c_str());
}

}  // namespace

bool enterPrivateRoot(bool ownsFiles) {
    mountOrThrow("none", "/", nullptr, MS_REC | MS_PRIVATE);
    std::error_code ignored;
    const std::string directory = fs::current_path(ignored).string();
    const auto kept = openKeptDirectories();
    umask(022);
    mountOrThrow("tmpfs", staging, "tmpfs", 0, "mode=755");
    const bool overlay = ownsFiles && mountOverlayRoot();
    if (overlay)
        bindOtherMounts();
    else
        mountLinkedRoot();
    mountFreshDirectories();
    putBackKeptDirectories(kept);
    mountKernelDirectories();
    hideKernelModules();
    switchToNewRoot(!overlay);
    if (chdir(directory.c_str()) != 0 && chdir("/") != 0)
        throw systemError("chdir /");
    return overlay;
}

}  // namespace veldtest
