// SPDX-License-Identifier: Apache-2.0
// The locked JSON files: what they look like, where their lock files lie, and writes that fail half-way, which leave a
// whole document.
#include "faultRun.h"
#include "storeFixture.h"
#include "utils/jsonFile.h"

#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>

using namespace veldtest;
using testing::ElementsAre;

namespace {

class JsonFile : public Store {};

mode_t modeOf(const std::string &path) {
    struct stat status = {};
    EXPECT_EQ(lstat(path.c_str(), &status), 0) << path;
    return status.st_mode;
}

TEST_F(JsonFile, DocumentIsStyledTextAndKeepsThePermissionsOfTheOldFile) {
    umask(0);
    const std::string path = profileDirectory + "1.json";
    ASSERT_TRUE(FW::jsonFileDump(json("{'b': [1, 'x'], 'a': null}"), path));
    EXPECT_EQ(readFile(path), "{\n   \"a\" : null,\n   \"b\" : [ 1, \"x\" ]\n}\n");
    EXPECT_EQ(modeOf(path), S_IFREG | 0666u);
    EXPECT_EQ(modeOf(lockDirectory), S_IFDIR | 0770u);
    EXPECT_EQ(modeOf(lockDirectory + "1.json.lock"), S_IFREG | 0660u);
    chmod(path.c_str(), 0600);
    store("1.json.tmp", std::string(10000, 'x'));  // left by a killed process
    ASSERT_TRUE(FW::jsonFileDump(json("{}"), path));
    EXPECT_EQ(modeOf(path), S_IFREG | 0600u);
    EXPECT_EQ(readFile(path), "{}\n");
    EXPECT_THAT(listDirectory(profileDirectory), ElementsAre("1.json"));
}

TEST_F(JsonFile, LockFileIsNamedAfterTheLastPathComponentAndMustHaveRoomForItsName) {
    const std::pair<std::string, std::string> cases[] = {
        {"/usr/veld/a.json", "a.json.lock"},
        {"/somewhere/else/a.json", "a.json.lock"},  // shared with the one before
        {"b", "b.lock"},
        {"/c/", "c.lock"},
        {"/" + std::string(1021, 'd') + "/e.json", std::string(1021, 'd') + ".lock"},  // only 1023 bytes are looked at
    };
    for (const auto &[path, name] : cases) {
        EXPECT_EQ(FW::getLockFile(path), lockDirectory + name);
        EXPECT_EQ(pathExists(lockDirectory + name), name.size() <= 255);
    }
    const std::string path = profileDirectory + std::string(246, 'n') + ".json";
    store(std::string(246, 'n') + ".json", "{}");
    Json::Value value;
    EXPECT_FALSE(FW::jsonFileLoad(value, path));
    EXPECT_FALSE(FW::jsonFileDump(value, path));
    const std::string message =
        "utils.cpp Failed to open json file " + path + ": the name is too long for its lock file";
    EXPECT_THAT(takeErrors(), ElementsAre(message, message));
    EXPECT_TRUE(FW::jsonFileDump(value, profileDirectory + std::string(245, 'n') + ".json"));
}

TEST_F(JsonFile, WithoutTheLockDirectoryLocksLieInTheTemporaryDirectoryAndPlantedOnesAreReplaced) {
    writeFile("/var/lock/firewall", "in the way");
    writeFile("/etc/victim", "text");
    ASSERT_EQ(symlink("/etc/victim", "/tmp/1.json.lock"), 0);
    writeFile("/tmp/2.json.lock", "", 0666);
    const bool canPlant = chown("/tmp/2.json.lock", 1234, 1234) == 0;
    for (const std::string name : {"1.json", "2.json", "3.json"}) {
        SCOPED_TRACE(name);
        const std::string lockPath = "/tmp/" + name + ".lock";
        EXPECT_EQ(FW::getLockFile(profileDirectory + name), lockPath);
        EXPECT_TRUE(FW::jsonFileDump(json("{}"), profileDirectory + name));
        struct stat status = {};
        ASSERT_EQ(lstat(lockPath.c_str(), &status), 0);
        EXPECT_TRUE(S_ISREG(status.st_mode) && status.st_uid == 0u);
    }
    EXPECT_EQ(readFile("/etc/victim"), "text");
    if (!canPlant)
        GTEST_SKIP() << "this user namespace has one user only: the file of another user was not tried";
}

#ifdef SYS_rename
constexpr uint64_t renameCall = SYS_rename;
#else
constexpr uint64_t renameCall = SYS_renameat;
#endif

const std::string file = "7.json";
const std::string path = profileDirectory + file;

Json::Value document(const std::string &name) {
    Json::Value value = json(namedDocument(name));
    for (int i = 0; i < 2000; ++i)  // several pages
        value["filling"].append(i);
    return value;
}

/// The name in the document, which must be whole.
std::string storedName() {
    Json::Value value = storedJson(file);
    EXPECT_EQ(value["filling"].size(), 2000u);
    return value["name"].asString();
}

int dumpNew() {
    return FW::jsonFileDump(document("new"), path) ? 0 : 1;
}

// What a write leaves when it is killed, the fault runs look at.
TEST_F(JsonFile, IsSyncedBeforeTheRenameAndItsDirectoryAfterAndFailuresAreReported) {
    ASSERT_TRUE(FW::jsonFileDump(document("old"), path));
    FaultRun undisturbed;
    try {
        undisturbed = runWithFault(dumpNew);
    } catch (const std::runtime_error &error) {
        GTEST_SKIP() << error.what();
    }
    const std::map<uint64_t, std::string> names = {
        {SYS_write, "write "}, {SYS_fsync, "fsync "}, {renameCall, "rename "}};
    std::string steps;
    for (const FaultPoint &point : undisturbed.points)
        steps += names.count(point.number) != 0 ? names.at(point.number) : "";
    EXPECT_EQ(steps.substr(steps.rfind("write ")), "write fsync rename fsync ");

    const std::string notWritten = "Failed to write json file " + path + ".tmp: ";
    const std::tuple<uint64_t, int, std::string> failures[] = {
        {SYS_fchmod, EPERM, notWritten + "Operation not permitted"},
        {SYS_write, ENOSPC, notWritten + "No space left on device"},
        {SYS_fsync, EIO, notWritten + "Input/output error"},
        {SYS_close, EIO, notWritten + "Input/output error"},
        {renameCall, EIO, "Failed to rename to " + path},
    };
    ASSERT_TRUE(FW::jsonFileDump(document("old"), path));
    auto point = undisturbed.points.begin();
    for (const auto &[number, error, message] : failures) {
        SCOPED_TRACE(message);
        point =
            std::find_if(point, undisturbed.points.end(), [wanted = number](auto &p) { return p.number == wanted; });
        ASSERT_NE(point, undisturbed.points.end());
        takeErrors();
        EXPECT_EQ(runWithFault(dumpNew, *point, error).status, 1);
        EXPECT_EQ(storedName(), "old");
        EXPECT_THAT(listDirectory(profileDirectory), ElementsAre(file));
        EXPECT_THAT(takeErrors(), ElementsAre("utils.cpp " + message));
    }
}

TEST_F(JsonFile, AReadOnlyOrVanishedDirectoryLeavesTheOldDocument) {
    ASSERT_EQ(mount("tmpfs", profileDirectory.c_str(), "tmpfs", 0, nullptr), 0);
    ASSERT_TRUE(FW::jsonFileDump(document("old"), path));
    ASSERT_EQ(mount(nullptr, profileDirectory.c_str(), nullptr, MS_REMOUNT | MS_RDONLY, nullptr), 0);
    EXPECT_EQ(dumpNew(), 1);
    EXPECT_EQ(FW::jsonFileCreate(document("new"), profileDirectory + "8.json"), FW::JsonFileCreated::FAILED);
    FW::jsonFileRemove(path);
    EXPECT_EQ(storedName(), "old");
    ASSERT_EQ(umount2(profileDirectory.c_str(), MNT_DETACH), 0);
    removeAll(profileDirectory);
    EXPECT_EQ(dumpNew(), 1);
    EXPECT_FALSE(pathExists(profileDirectory));
    makeDirectories(path);
    EXPECT_EQ(dumpNew(), 1);
    EXPECT_THAT(listDirectory(profileDirectory), ElementsAre(file));
}

}  // namespace
