// SPDX-License-Identifier: Apache-2.0
// Key/value files, string lists and the last-error record.
#include "core/keyValueText.h"
#include "files.h"
#include "planting.h"
#include "systemLog.h"
#include "veld/core.h"

#include <sys/mount.h>
#include <sys/stat.h>

#include <random>
#include <thread>

using namespace veldtest;

namespace {

std::string get(const std::string &file, const std::string &key, int *result = nullptr) {
    char buffer[256];
    const int length = VLIBCFileGetKeyValue(file.c_str(), key.c_str(), buffer, sizeof buffer, 0);
    if (result != nullptr)
        *result = length;
    return length < 0 ? "error" : std::string(buffer, static_cast<size_t>(length));
}

mode_t modeOf(const std::string &file) {
    struct stat info {};
    return lstat(file.c_str(), &info) == 0 ? info.st_mode : 0;
}

TEST(KeyValueText, LinesAreReadAsDocumented) {
    const std::string text = "# k=comment\n"
                             "k2=other\n"
                             "  k \t= \"a  b \"  \r\n"
                             "k=second line does not count\n"
                             "plain = a  b  \n"
                             "commented=x y # rest\n"
                             "hash=a#b\n"
                             "quotedhash=\"a # b\" # rest\n"
                             "equals=a=b\n"
                             "open=\"never closed\n"
                             "backslash=\"a\\n\"\n"
                             "empty=\nblank=\"\"\n"
                             "no equals sign\n"
                             "last=end";
    const std::pair<const char *, const char *> expected[] = {
        {"k", "a  b "},        {"k2", "other"},         {"plain", "a  b"}, {"commented", "x y"},
        {"hash", "a#b"},       {"quotedhash", "a # b"}, {"equals", "a=b"}, {"open", "never closed"},
        {"backslash", "a\\n"}, {"empty", ""},           {"blank", ""},     {"last", "end"}};
    for (const auto &[key, value] : expected)
        EXPECT_EQ(veld::findKeyValue(text, key), std::optional<std::string>(value)) << key;
    for (const char *key : {"", "K", "no equals sign", "# k", "rest"})
        EXPECT_FALSE(veld::findKeyValue(text, key)) << key;
}

TEST(KeyValueText, OtherLinesStayByteForByte) {
    EXPECT_EQ(veld::replaceKeyValue("", "k", "v"), "k=\"v\"\n");
    EXPECT_EQ(veld::replaceKeyValue("# c\r\n\n a = 1 # x\n\tk = old # y\r\nk=2\nlast", "k", "v"),
              "# c\r\n\n a = 1 # x\nk=\"v\"\r\nk=2\nlast");
    EXPECT_EQ(veld::replaceKeyValue("last=1", "k", "v"), "last=1\nk=\"v\"\n");
}

TEST(KeyValueText, WhatIsAcceptedReadsBackAndLeavesTheOthersAlone) {
    std::mt19937 random(20240607);
    const std::string alphabet = "ab=\"# \t\r\n\\'\x01";
    const auto word = [&] {
        std::string text(random() % 6, ' ');
        for (char &c : text)
            c = alphabet[random() % alphabet.size()];
        return text;
    };
    int accepted = 0;
    std::string text = "first=1\n#x\n";
    for (int i = 0; i < 20000; ++i) {
        const std::string key = word();
        const std::string value = word();
        if (!veld::isRepresentableKey(key) || !veld::isRepresentableValue(value))
            continue;
        ++accepted;
        text = veld::replaceKeyValue(text, key, value);
        ASSERT_EQ(veld::findKeyValue(text, key), std::optional(value)) << testing::PrintToString(key);
        ASSERT_EQ(veld::findKeyValue(text, "first"), std::optional<std::string>("1"));
    }
    EXPECT_GT(accepted, 500);
}

TEST(KeyValueFile, SetThenGetAndCheck) {
    const std::string file = "/run/state";
    int result = 0;
    EXPECT_EQ(get(file, "k", &result), "error");
    EXPECT_EQ(VLIBCErrGet(), 0x0E00 | ENOENT);
    EXPECT_STREQ(VLIBCErrorGetFile(), "keyValueFile.cpp");
    EXPECT_GT(VLIBCErrorGetLine(), 0);
    EXPECT_GE(VLIBCFileSetKeyValue(file.c_str(), "k", "yes", 0), 0);
    EXPECT_GE(VLIBCFileSetKeyValue(file.c_str(), "other", "a b", 0), 0);
    EXPECT_GE(VLIBCFileSetKeyValue(file.c_str(), "k", "no", 0), 0);
    EXPECT_EQ(readFile(file), "k=\"no\"\nother=\"a b\"\n");
    EXPECT_EQ(get(file, "other", &result), "a b");
    EXPECT_EQ(result, 3);
    EXPECT_EQ(get(file, "absent", &result), "");
    EXPECT_EQ(result, 0);
    char small[3] = "zz";
    EXPECT_EQ(VLIBCFileGetKeyValue(file.c_str(), "other", small, sizeof small, 0), 2);
    EXPECT_STREQ(small, "a ");
    EXPECT_EQ(VLIBCFileCheckKeyValue(file.c_str(), "k", "no", 0), 1);
    for (const auto &[key, value] : {std::pair("k", "n"), std::pair("k", "no "), std::pair("absent", "")})
        EXPECT_EQ(VLIBCFileCheckKeyValue(file.c_str(), key, value, 0), 0) << key << value;
    EXPECT_EQ(VLIBCFileExist(file.c_str()), 1);
    for (const char *none : {"", "/run", "/run/absent"})
        EXPECT_EQ(VLIBCFileExist(none), 0) << none;
}

TEST(KeyValueFile, WhatCannotBeWrittenIsRefusedAndChangesNothing) {
    const std::string file = "/run/state";
    writeFile(file, "k=1\n");
    for (const char *value : {"a\nb", "a\"b", "a\rb"})
        EXPECT_LT(VLIBCFileSetKeyValue(file.c_str(), "k", value, 0), 0) << value;
    for (const char *key : {"", " k", "k ", "#k", "a=b", "a\nb"})
        EXPECT_LT(VLIBCFileSetKeyValue(file.c_str(), key, "v", 0), 0) << key;
    EXPECT_EQ(VLIBCErrGet(), 0x0D00);
    EXPECT_LT(VLIBCFileSetKeyValue("/run/no/such/dir/file", "k", "v", 0), 0);
    EXPECT_EQ(readFile(file), "k=1\n");
}

TEST(KeyValueFile, ModeAndOwnLinkSurviveAReplacement) {
    makeDirectories("/run/real");
    writeFile("/run/real/state", "k=1\n", 0640);
    ASSERT_EQ(symlink("real/state", "/run/state"), 0);
    EXPECT_GE(VLIBCFileSetKeyValue("/run/state", "k", "2", 0), 0);
    EXPECT_TRUE(S_ISLNK(modeOf("/run/state")));
    EXPECT_EQ(modeOf("/run/real/state") & 07777U, 0640U);
    EXPECT_EQ(readFile("/run/real/state"), "k=\"2\"\n");
    EXPECT_EQ(listDirectory("/run/real"), std::vector<std::string>{"state"});
}

TEST(KeyValueFile, FullDiskLeavesTheOldFile) {
    SystemLog log;
    makeDirectories("/run/small");
    ASSERT_EQ(mount("tmpfs", "/run/small", "tmpfs", 0, "size=32k"), 0);
    const std::string old = "k=1\n" + std::string(12 * 1024, '#') + "\n";
    writeFile("/run/small/state", old);
    writeFile("/run/small/filler", std::string(12 * 1024, 'x'));
    EXPECT_LT(VLIBCFileSetKeyValue("/run/small/state", "k", "2", 0), 0);
    EXPECT_EQ(VLIBCErrGet(), 0x0E00 | ENOSPC);
    EXPECT_EQ(readFile("/run/small/state"), old);
    EXPECT_EQ(listDirectory("/run/small"), (std::vector<std::string>{"filler", "state"}));
    EXPECT_EQ(umount("/run/small"), 0);
    EXPECT_TRUE(log.contains("/run/small/state: cannot set k: No space left on device")) << log.text();
}

TEST(KeyValueFile, WhatAnotherUserPlantedIsNotReadAndNotFollowed) {
    SKIP_WITHOUT_OTHER_USERS();
    static const std::string file = "/tmp/iptables_serv_mod_list";
    writeFile("/run/victim", "firewall=\"yes\"\n", 0600);
    struct Planted {
        const char *what;
        bool (*plant)();
    };
    const Planted cases[] = {{"file",
                              [] {
                                  FILE *stream = fopen(file.c_str(), "w");
                                  return stream != nullptr && fputs("firewall=\"yes\"\n", stream) > 0 &&
                                         fclose(stream) == 0;
                              }},
                             {"link", [] { return symlink("/run/victim", file.c_str()) == 0; }},
                             {"FIFO", [] { return mkfifo(file.c_str(), 0666) == 0; }},
                             {"directory", [] { return mkdir(file.c_str(), 0777) == 0; }}};
    SystemLog log;
    for (const Planted &planted : cases) {
        unlink(file.c_str());
        log.clear();
        ASSERT_EQ(asStranger(planted.plant), 0) << planted.what;
        EXPECT_EQ(get(file, "firewall"), "error") << planted.what;
        EXPECT_TRUE(log.contains(file)) << planted.what;
        EXPECT_EQ(VLIBCFileCheckKeyValue(file.c_str(), "firewall", "yes", 0), 0) << planted.what;
        EXPECT_GE(VLIBCFileSetKeyValue(file.c_str(), "other", "no", 0), 0) << planted.what << log.text();
        EXPECT_TRUE(S_ISREG(modeOf(file))) << planted.what;
        EXPECT_EQ(readFile(file), "other=\"no\"\n") << planted.what;
        EXPECT_EQ(readFile("/run/victim"), "firewall=\"yes\"\n") << planted.what;
    }
    // A second name of a trusted file is no trusted file.
    writeFile("/tmp/trusted", "firewall=\"yes\"\n");
    unlink(file.c_str());
    ASSERT_EQ(link("/tmp/trusted", file.c_str()), 0);
    EXPECT_EQ(get(file, "firewall"), "error");
}

TEST(Support, IsAYesInTheInformationFile) {
    EXPECT_EQ(VLIBCSupportGet("support_wireless"), 0);
    writeFile("/etc.defaults/veldinfo.conf", "support_wireless=\"yes\"\nsupport_other=\"no\"\n");
    EXPECT_EQ(VLIBCSupportGet("support_wireless"), 1);
    EXPECT_EQ(VLIBCSupportGet("support_other"), 0);
    EXPECT_EQ(VLIBCSupportGet(nullptr), 0);
}

TEST(SzList, GrowsAndKeepsCopies) {
    PVLIBCSZLIST list = VLIBCSzListAlloc(0);
    ASSERT_NE(list, nullptr);
    for (int i = 0; i < 100; ++i) {
        std::string text = std::to_string(i);
        EXPECT_EQ(VLIBCSzListPush(&list, text.c_str()), i + 1);
    }
    EXPECT_EQ(list->nItem, 100);
    EXPECT_STREQ(VLIBCSzListGet(list, 99), "99");
    EXPECT_EQ(VLIBCSzListGet(list, 100), nullptr);
    EXPECT_EQ(VLIBCSzListGet(list, -1), nullptr);
    EXPECT_LT(VLIBCSzListPush(&list, nullptr), 0);
    VLIBCSzListFree(list);
    VLIBCSzListFree(nullptr);
    EXPECT_EQ(VLIBCSzListAlloc(-1), nullptr);
}

TEST(LastError, BelongsToItsThread) {
    VLIBCErrSetEx(1, "here.c", 2);
    std::thread([] {
        EXPECT_EQ(VLIBCErrGet(), 0);
        EXPECT_STREQ(VLIBCErrorGetFile(), "");
        VLIBCErrSetEx(3, nullptr, 4);
        EXPECT_STREQ(VLIBCErrorGetFile(), "");
    }).join();
    EXPECT_EQ(VLIBCErrGet(), 1);
    EXPECT_STREQ(VLIBCErrorGetFile(), "here.c");
    EXPECT_EQ(VLIBCErrorGetLine(), 2);
}

}  // namespace
