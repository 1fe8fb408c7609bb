// SPDX-License-Identifier: Apache-2.0
// The registry of services: definition files, the services database, and broken or hostile files.
#include "files.h"
#include "serviceconf/serviceDefinition.h"
#include "systemLog.h"
#include "veld/serviceconf.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

using namespace veldtest;

namespace {

const std::string directory = "/usr/veld/etc/services.d/";

std::string definition(const std::string &name, const std::string &ports, const std::string &more = "") {
    return "{ \"name\": \"" + name + "\"" + more +
           ", \"source\": { \"protocol\": \"udp\", \"ports\": [] }, "
           "\"destination\": { \"protocol\": \"tcp\", \"ports\": [" +
           ports + "] } }";
}

/// The registry as long as it lives.
class Registry {
public:
    Registry() { count = VELDFwServiceEnum(&handle_); }
    ~Registry() { VELDFwServiceFree(handle_); }
    Registry(const Registry &) = delete;
    Registry &operator=(const Registry &) = delete;
    const VELDFWSERVICE *operator[](const char *name) const { return VELDFWServiceFind(handle_, name); }
    /// "kind:source ports:destination ports", "none" without a record.
    std::string text(const char *name) const {
        const VELDFWSERVICE *service = (*this)[name];
        if (service == nullptr)
            return "none";
        std::string result = std::to_string(service->protocolKind);
        for (const VLIBCSZLIST *list : {service->srcPorts, service->dstPorts}) {
            result += ":";
            for (int i = 0; i < list->nItem; ++i)
                result += std::string(i > 0 ? "," : "") + VLIBCSzListGet(list, i);
        }
        return result;
    }
    int count = 0;

private:
    VELDFWSERVICE_HANDLE handle_ = nullptr;
};

TEST(ServiceDefinition, BadOnesAreRefusedWithAReason) {
    const std::string manyBrackets(100000, '[');
    const std::string bad[] = {
        "",
        "[]",
        "{}",
        definition("ssh", "\"22\"") + "}",
        definition("", "\"22\""),
        definition("two words", "\"22\""),
        definition("a\\u0000b", "\"22\""),
        definition("ssh", "22"),
        definition("ssh", "\"22\"", ", \"enabled\": 1"),
        R"({"name": 5, "destination": {"protocol": "tcp", "ports": ["22"]}})",
        R"({"name": "ssh"})",
        R"({"name": "ssh", "destination": {"protocol": "sctp", "ports": ["22"]}})",
        R"({"name": "ssh", "destination": {"protocol": 1, "ports": ["22"]}})",
        R"({"name": "ssh", "destination": {"protocol": "tcp", "ports": "22"}})",
        R"({"name": "ssh", "destination": []})",
        R"({"name": "ssh", "destination": {"protocol": "tcp", "ports": ["22"]}, "source": 7})",
        "{\"name\":" + manyBrackets,
        std::string(100000, ' '),
    };
    for (const std::string &text : bad) {
        veld::ServiceDefinition service;
        std::string reason;
        EXPECT_FALSE(veld::parseServiceDefinition(text, service, reason)) << text.substr(0, 80);
        EXPECT_FALSE(reason.empty()) << text.substr(0, 80);
    }
    for (const char *port : {"1", "65535", "1-65535", "80-80"})
        EXPECT_TRUE(veld::isPortEntry(port)) << port;
    for (const char *port : {"", "0", "65536", "022", "-", "1-", "-1", "2-1", "1-2-3", "80 ", "ssh", "+1", "1:2"})
        EXPECT_FALSE(veld::isPortEntry(port)) << port;
}

TEST(ServiceRegistry, DefinitionFilesWinOverTheDatabaseWhoseEntriesAreJoined) {
    SystemLog log;
    writeFile("/etc/services", "ssh 22/tcp\nhttp 80/tcp www\nhttp 80/udp www\nfinger 79/tcp\nsplit 100/udp\n"
                               "split 200/tcp\nlater 300/tcp www\nsctponly 400/sctp\nhttp 8080/tcp\n");
    writeFile(directory + "10-ssh.json", definition("ssh", "\"2222\", \"1000-2000\""));
    writeFile(directory + "20-finger.json", definition("finger", "\"79\"", ", \"enabled\": false"));
    writeFile(directory + "30-again.json", definition("ssh", "\"2223\""));
    writeFile(directory + "40-ping.json", R"({"name":"ping","destination":{"protocol":"icmp"}})");
    writeFile(directory + "50-empty.json", definition("empty", ""));
    const Registry registry;
    EXPECT_EQ(registry.count, 8);
    const std::pair<const char *, std::string> expected[] = {
        {"ssh", "1::2222,1000-2000"},
        {"http", "3::80"},
        {"www", "3::80"},
        {"split", "1::200"},
        {"later", "1::300"},
        {"sctponly", "none"},
        {"ping", std::to_string(VELDFW_SERVICE_ICMP) + "::"},
        {"empty", "2::"},  // that of the source, the destination being empty
    };
    for (const auto &[name, text] : expected)
        EXPECT_EQ(registry.text(name), text) << name;
    ASSERT_NE(registry["finger"], nullptr);
    EXPECT_EQ(registry["finger"]->data, 0);
    EXPECT_NE(registry["http"]->data, 0);
    EXPECT_STREQ(registry["http"]->szName, "http");
    EXPECT_TRUE(log.contains("/30-again.json is skipped: an earlier file defines \"ssh\"")) << log.text();
    EXPECT_EQ(log.messages().size(), 1U) << log.text();
}

TEST(ServiceRegistry, HostileFilesAreNamedAndSkipped) {
    SystemLog log;
    writeFile("/etc/services", "");
    writeFile(directory + "good.json", definition("good", "\"1\""));
    writeFile(directory + "empty.json", "");
    writeFile(directory + "deep.json", std::string(100000, '['));
    writeFile(directory + "huge.json", std::string(4 << 20, ' ') + definition("huge", "\"1\""));
    makeDirectories(directory + "directory.json");
    ASSERT_EQ(mkfifo((directory + "fifo.json").c_str(), 0644), 0);
    ASSERT_EQ(symlink("nowhere", (directory + "dangling.json").c_str()), 0);
    ASSERT_EQ(symlink("/dev/zero", (directory + "device.json").c_str()), 0);
    for (const char *ignored : {"ignored.txt", ".hidden.json"})
        writeFile(directory + ignored, definition("ignored", "\"1\""));
    {
        const Registry registry;
        EXPECT_EQ(registry.count, 1);
        EXPECT_EQ(registry.text("good"), "1::1");
    }
    for (const char *name : {"empty", "deep", "huge", "directory", "fifo", "dangling", "device"})
        EXPECT_EQ(log.count(std::string("/") + name + ".json is skipped: "), 1U) << name << log.text();
    EXPECT_EQ(log.messages().size(), 7U) << log.text();
    removeAll(directory);
    const Registry nothing;
    EXPECT_EQ(nothing.count, 0);
    EXPECT_EQ(nothing.text("good"), "none");
}

}  // namespace
