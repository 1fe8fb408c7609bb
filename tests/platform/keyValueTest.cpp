// SPDX-License-Identifier: Apache-2.0
// Key/value files, string lists and the last-error record.
#include "core/keyValueText.h"
#include "planting.h"
#include "systemLog.h"
#include "veld/core.h"

#include <sys/mount.h>

#include <thread>

using namespace veldtest;

namespace {

std::string get(const std::string &file, const std::string &key) {
    char buffer[256];
    const int length = VLIBCFileGetKeyValue(file.c_str(), key.c_str(), buffer, sizeof buffer, 0);
    return length < 0 ? "error" : std::string(buffer, static_cast<size_t>(length));
}

int set(const std::string &file, const std::string &key, const std::string &value) {
    return VLIBCFileSetKeyValue(file.c_str(), key.c_str(), value.c_str(), 0);
}

TEST(KeyValueText, LinesAreReadAsDocumentedAndOthersStayByteForByte) {
    const std::string text = "# k=comment\n  k \t= \"a  b \"  \r\nk=second line does not count\nplain = a  b  \n"
                             "commented=x y # rest\nhash=a#b\nquotedhash=\"a # b\" # rest\nequals=a=b\n"
                             "open=\"never closed\nbackslash=\"a\\n\"\nempty=\nno equals sign\nlast=end";
    const std::pair<const char *, const char *> expected[] = {
        {"k", "a  b "},    {"plain", "a  b"},        {"commented", "x y"},  {"hash", "a#b"}, {"quotedhash", "a # b"},
        {"equals", "a=b"}, {"open", "never closed"}, {"backslash", "a\\n"}, {"empty", ""},   {"last", "end"}};
    for (const auto &[key, value] : expected)
        EXPECT_EQ(veld::findKeyValue(text, key), std::optional<std::string>(value)) << key;
    for (const char *key : {"", "K", "no equals sign", "# k", "rest"})
        EXPECT_FALSE(veld::findKeyValue(text, key)) << key;
    EXPECT_EQ(veld::replaceKeyValue("# c\r\n\n a = 1 # x\n\tk = old # y\r\nk=2\nlast", "k", "v"),
              "# c\r\n\n a = 1 # x\nk=\"v\"\r\nk=2\nlast");
    EXPECT_EQ(veld::replaceKeyValue("last=1", "k", "v"), "last=1\nk=\"v\"\n");
}

TEST(KeyValueFile, SetThenGetAndCheckAndRefusalsChangeNothing) {
    const std::string file = "/run/state";
    EXPECT_EQ(get(file, "k"), "error");
    EXPECT_EQ(VLIBCErrGet(), 0x0E00 | ENOENT);
    EXPECT_STREQ(VLIBCErrorGetFile(), "keyValueFile.cpp");
    EXPECT_GE(set(file, "k", "yes"), 0);
    EXPECT_GE(set(file, "other", "a b"), 0);
    EXPECT_GE(set(file, "k", "no"), 0);
    for (const char *value : {"a\nb", "a\"b", "a\rb"})
        EXPECT_LT(set(file, "k", value), 0) << value;
    for (const char *key : {"", " k", "k ", "#k", "a=b", "a\nb"})
        EXPECT_LT(set(file, key, "v"), 0) << key;
    EXPECT_EQ(VLIBCErrGet(), 0x0D00);
    EXPECT_LT(set("/run/no/such/dir/file", "k", "v"), 0);
    EXPECT_EQ(readFile(file), "k=\"no\"\nother=\"a b\"\n");
    EXPECT_EQ(get(file, "absent"), "");
    char small[3] = "zz";
    EXPECT_EQ(VLIBCFileGetKeyValue(file.c_str(), "other", small, sizeof small, 0), 2);
    EXPECT_STREQ(small, "a ");
    for (const char *value : {"no", "n", "no ", ""})
        EXPECT_EQ(VLIBCFileCheckKeyValue(file.c_str(), "k", value, 0), value == std::string("no") ? 1 : 0) << value;
    for (const char *path : {"/run/state", "", "/run", "/run/absent"})
        EXPECT_EQ(VLIBCFileExist(path), path == file ? 1 : 0) << path;
}

TEST(KeyValueFile, ReplacementKeepsModeAndOwnLinkAndOnAFullDiskTheOldFile) {
    SystemLog log;
    makeDirectories("/run/small");
    ASSERT_EQ(mount("tmpfs", "/run/small", "tmpfs", 0, "size=32k"), 0);
    writeFile("/run/small/state", "k=1\n", 0640);
    ASSERT_EQ(symlink("small/state", "/run/state"), 0);
    EXPECT_GE(set("/run/state", "k", "2"), 0);
    EXPECT_EQ(readFile("/run/small/state"), "k=\"2\"\n");
    EXPECT_TRUE(isOwnFile("/run/small/state", 0640));
    const std::string old = "k=2\n" + std::string(12 * 1024, '#');
    writeFile("/run/small/state", old);
    writeFile("/run/small/filler", std::string(12 * 1024, 'x'));
    EXPECT_LT(set("/run/state", "k", "3"), 0);
    EXPECT_EQ(VLIBCErrGet(), 0x0E00 | ENOSPC);
    EXPECT_EQ(readFile("/run/state"), old);
    EXPECT_EQ(listDirectory("/run/small"), (std::vector<std::string>{"filler", "state"}));
    EXPECT_TRUE(log.contains("cannot set k: No space left on device")) << log.text();
}

TEST(KeyValueFile, WhatAnotherUserPlantedIsNotReadAndNotFollowed) {
    SKIP_WITHOUT_OTHER_USERS();
    const std::string file = "/tmp/iptables_serv_mod_list";
    const std::string secret = "firewall=\"yes\"\n";
    writeFile("/run/victim", secret, 0600);
    SystemLog log;
    for (const Planted &planted : plantedThings(file, "/run/victim", secret)) {
        SCOPED_TRACE(planted.what);
        removeAll(file);
        log.clear();
        ASSERT_EQ(asStranger(planted.plant), 0);
        EXPECT_EQ(get(file, "firewall"), "error");
        EXPECT_TRUE(log.contains(file));
        EXPECT_EQ(VLIBCFileCheckKeyValue(file.c_str(), "firewall", "yes", 0), 0);
        EXPECT_GE(set(file, "other", "no"), 0) << log.text();
        EXPECT_TRUE(isOwnFile(file));
        EXPECT_EQ(readFile(file), "other=\"no\"\n");
        EXPECT_EQ(readFile("/run/victim"), secret);
    }
    // A second name of a trusted file is no trusted file.
    removeAll(file);
    writeFile("/tmp/trusted", secret);
    ASSERT_EQ(link("/tmp/trusted", file.c_str()), 0);
    EXPECT_EQ(get(file, "firewall"), "error");
}

TEST(SzList, GrowsAndKeepsCopies) {
    PVLIBCSZLIST list = VLIBCSzListAlloc(0);
    for (int i = 0; i < 100; ++i)
        EXPECT_EQ(VLIBCSzListPush(&list, std::to_string(i).c_str()), i + 1);
    EXPECT_STREQ(VLIBCSzListGet(list, 99), "99");
    EXPECT_TRUE(VLIBCSzListGet(list, -1) == nullptr && VLIBCSzListGet(list, 100) == nullptr);
    EXPECT_LT(VLIBCSzListPush(&list, nullptr), 0);
    VLIBCSzListFree(list);
}

TEST(LastError, BelongsToItsThread) {
    VLIBCErrSetEx(1, "here.c", 2);
    std::thread([] { VLIBCErrSetEx(3, nullptr, 4); }).join();
    EXPECT_EQ(VLIBCErrGet(), 1);
    EXPECT_STREQ(VLIBCErrorGetFile(), "here.c");
    EXPECT_EQ(VLIBCErrorGetLine(), 2);
}

}  // namespace
