// SPDX-License-Identifier: Apache-2.0
// Writes that are killed or fail half-way leave a whole document, and finished ones are on the disk.
#include "storeFixture.h"
#include "tracedChild.h"
#include "utils/jsonFile.h"

#include <fcntl.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>

#include <cerrno>
#include <cstddef>
#include <map>
#include <memory>
#include <set>

using namespace veldtest;
using testing::ElementsAre;

namespace {

#ifdef SYS_rename
constexpr unsigned renameCall = SYS_rename;
#else
constexpr unsigned renameCall = SYS_renameat;
#endif

const std::string file = "7.json";
const std::string path = profileDirectory + file;

Json::Value document(const std::string &name) {
    Json::Value value = json(namedDocument(name));
    for (int i = 0; i < 2000; ++i)  // several pages
        value["filling"].append(i);
    return value;
}

/// The name in the document, which must be whole; "none" when there is no file.
std::string storedName() {
    if (!pathExists(path))
        return "none";
    Json::Value value = storedJson(file);
    EXPECT_EQ(value["filling"].size(), 2000u);
    return value["name"].asString();
}

class InterruptedWrite : public Store {};

TEST_F(InterruptedWrite, KilledAtAnySystemCallTheDocumentIsOldOrNewAndTheNextDumpWorks) {
    const struct {
        const char *what;
        std::string before;
        std::function<void()> write;
        std::string after;
    } operations[] = {
        {"dump", "old", [] { FW::jsonFileDump(document("new"), path); }, "new"},
        {"first dump", "none", [] { FW::jsonFileDump(document("new"), path); }, "new"},
        {"create", "none", [] { FW::jsonFileCreate(document("new"), path); }, "new"},
        {"remove", "old", [] { FW::jsonFileRemove(path); }, "none"},
    };
    for (const auto &operation : operations) {
        std::set<std::string> seen;
        bool ended = false;
        for (int stops = 1; !ended; ++stops) {
            SCOPED_TRACE(std::string(operation.what) + " killed at stop " + std::to_string(stops));
            removeAll(path);
            if (operation.before != "none") {
                ASSERT_TRUE(FW::jsonFileDump(document(operation.before), path));
            }
            try {
                TracedChild child(operation.write);
                for (int i = 0; i < stops && !ended; ++i)
                    ended = !child.next();
            } catch (const std::runtime_error &error) {
                GTEST_SKIP() << error.what();
            }
            seen.insert(storedName());
            ASSERT_TRUE(FW::jsonFileDump(document("next"), path));
            EXPECT_EQ(storedName(), "next");
            EXPECT_THAT(listDirectory(profileDirectory), ElementsAre(file));
            ASSERT_LT(stops, 1000);
        }
        EXPECT_EQ(seen, (std::set{operation.before, operation.after}));
    }
    EXPECT_EQ(takeErrors(), std::vector<std::string>{});
}

TEST_F(InterruptedWrite, FileIsSyncedBeforeTheRenameAndItsDirectoryAfterAndNothingIsInheritable) {
    std::unique_ptr<TracedChild> child;
    try {
        child = std::make_unique<TracedChild>([] { FW::jsonFileDump(document("new"), path); });
    } catch (const std::runtime_error &error) {
        GTEST_SKIP() << error.what();
    }
    std::map<uint64_t, std::string> opened;
    std::vector<std::string> steps;
    const auto step = [&](const std::string &line) {
        const bool ofStore = line.find(profileDirectory) != std::string::npos;
        if (ofStore && (steps.empty() || steps.back() != line))
            steps.push_back(line);
    };
    while (child->next()) {
        const auto &arguments = child->arguments;
        if (child->number == SYS_openat && !child->atEntry && child->result >= 0) {
            const std::string name = child->text(arguments[1]);
            opened[static_cast<uint64_t>(child->result)] = name;
            if (name.find("firewall") != std::string::npos) {
                EXPECT_NE(arguments[2] & O_CLOEXEC, 0u) << name;
            }
        }
        if (!child->atEntry)
            continue;
        if (child->number == SYS_write)
            step("write " + opened[arguments[0]]);
        else if (child->number == SYS_fsync)
            step("fsync " + opened[arguments[0]]);
        else if (child->number == SYS_close)
            step("close " + opened[arguments[0]]);
        else if (child->number == renameCall)
            step("rename " + child->text(arguments[renameCall == SYS_renameat ? 3 : 1]));
    }
    EXPECT_THAT(steps, ElementsAre("write " + path + ".tmp", "fsync " + path + ".tmp", "close " + path + ".tmp",
                                   "rename " + path, "fsync " + profileDirectory, "close " + profileDirectory));
}

/// Lets every use of a system call of this process fail from now on.
bool failSystemCall(unsigned number, unsigned error) {
    sock_filter code[] = {
        BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, nr)),
        BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, number, 0, 1),
        BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ERRNO | error),
        BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW),
    };
    const sock_fprog program = {static_cast<unsigned short>(std::size(code)), code};
    return prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0 && prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program) == 0;
}

TEST_F(InterruptedWrite, AFailingSystemCallLeavesTheOldDocumentAndIsReported) {
    const struct {
        unsigned number;
        unsigned error;
        std::string message;
    } failures[] = {
        {SYS_fchmod, EPERM, "Failed to write json file " + path + ".tmp: Operation not permitted"},
        {SYS_write, ENOSPC, "Failed to write json file " + path + ".tmp: No space left on device"},
        {SYS_fsync, EIO, "Failed to write json file " + path + ".tmp: Input/output error"},
        {SYS_close, EIO, "Failed to write json file " + path + ".tmp: Input/output error"},
        {renameCall, EIO, "Failed to rename to " + path},
    };
    ASSERT_TRUE(FW::jsonFileDump(document("old"), path));
    for (const auto &failure : failures) {
        SCOPED_TRACE(failure.message);
        const int outcome = runInChild([&] {
            if (!failSystemCall(failure.number, failure.error))
                return 2;
            return FW::jsonFileDump(document("new"), path) ? 1 : 0;
        });
        if (outcome == 2)
            GTEST_SKIP() << "system calls may not be filtered here";
        EXPECT_EQ(outcome, 0);
        EXPECT_EQ(storedName(), "old");
        EXPECT_THAT(listDirectory(profileDirectory), ElementsAre(file));
        EXPECT_THAT(takeErrors(), ElementsAre("utils.cpp " + failure.message));
    }
    EXPECT_TRUE(FW::jsonFileDump(document("new"), path));
}

TEST_F(InterruptedWrite, AFullDiskOrAReadOnlyOrVanishedDirectoryLeavesTheOldDocument) {
    ASSERT_EQ(mount("tmpfs", profileDirectory.c_str(), "tmpfs", 0, "size=64k"), 0);
    ASSERT_TRUE(FW::jsonFileDump(document("old"), path));
    EXPECT_NE(runProgram({"dd", "if=/dev/zero", "of=" + profileDirectory + "rest", "bs=4k"}).status, 0);
    EXPECT_FALSE(FW::jsonFileDump(document("new"), path));
    EXPECT_EQ(storedName(), "old");
    EXPECT_THAT(listDirectory(profileDirectory), ElementsAre(file, "rest"));
    EXPECT_THAT(takeErrors(),
                ElementsAre("utils.cpp Failed to write json file " + path + ".tmp: No space left on device"));
    removeAll(profileDirectory + "rest");
    EXPECT_TRUE(FW::jsonFileDump(document("new"), path));
    ASSERT_EQ(mount(nullptr, profileDirectory.c_str(), nullptr, MS_REMOUNT | MS_RDONLY, nullptr), 0);
    EXPECT_FALSE(FW::jsonFileDump(document("newer"), path));
    EXPECT_EQ(FW::jsonFileCreate(document("newer"), profileDirectory + "8.json"), FW::JsonFileCreated::FAILED);
    FW::jsonFileRemove(path);
    EXPECT_EQ(storedName(), "new");
    ASSERT_EQ(umount2(profileDirectory.c_str(), MNT_DETACH), 0);
    removeAll(profileDirectory);
    EXPECT_FALSE(FW::jsonFileDump(document("new"), path));
    EXPECT_FALSE(pathExists(profileDirectory));
    makeDirectories(path);
    EXPECT_FALSE(FW::jsonFileDump(document("new"), path));
    EXPECT_THAT(listDirectory(profileDirectory), ElementsAre(file));
}

}  // namespace
