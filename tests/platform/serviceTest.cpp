// SPDX-License-Identifier: Apache-2.0
// The registry of services: definition files, the services database, and broken or hostile files.
#include "caseTable.h"
#include "files.h"
#include "serviceconf/serviceDefinition.h"
#include "systemLog.h"
#include "veld/serviceconf.h"

#include <sys/stat.h>
#include <unistd.h>

using namespace veldtest;

namespace {

const std::string directory = "/usr/veld/etc/services.d/";

std::string definition(const std::string &name, const std::string &ports, const std::string &more = "") {
    return R"({"name": ")" + name + "\"" + more + R"(, "source": {"protocol": "udp", "ports": []},
        "destination": {"protocol": "tcp", "ports": [)" +
           ports + "]}}";
}

/// "number of services; " and of each name " name=kind:source ports:destination ports", with "off" and "none".
std::string registryText(const std::vector<std::string> &names) {
    VELDFWSERVICE_HANDLE handle = nullptr;
    std::string text = std::to_string(VELDFwServiceEnum(&handle)) + ";";
    for (const std::string &name : names) {
        const VELDFWSERVICE *service = VELDFWServiceFind(handle, name.c_str());
        text += " " + name + "=" + (service == nullptr ? "none" : std::to_string(service->protocolKind));
        if (service == nullptr)
            continue;
        EXPECT_EQ(service->szName, name);
        for (const VLIBCSZLIST *list : {service->srcPorts, service->dstPorts}) {
            for (int i = 0; i < list->nItem; ++i)
                text += (i > 0 ? "," : ":") + std::string(VLIBCSzListGet(list, i));
            text += list->nItem == 0 ? ":" : "";
        }
        text += service->data != 0 ? "" : "off";
    }
    VELDFwServiceFree(handle);
    return text;
}

TEST(ServiceDefinition, BadOnesAreRefusedWithTheirReason) {
    auto cases = readCases(VELD_CASE_DIRECTORY "badServices.cases", 2);
    cases.push_back({"{\"name\":" + std::string(100000, '['), "stack"});
    for (const auto &row : cases) {
        veld::ServiceDefinition service;
        std::string reason;
        EXPECT_FALSE(veld::parseServiceDefinition(row[0], service, reason)) << row[0].substr(0, 80);
        EXPECT_NE(reason.find(row[1]), std::string::npos) << row[0].substr(0, 80) << ": " << reason;
    }
    for (const char *port : {"1", "65535", "1-65535", "80-80"})
        EXPECT_TRUE(veld::isPortEntry(port)) << port;
    for (const char *port : {"", "65536", "022", "-", "1-", "-1", "1-2-3", "80 ", "ssh", "+1", "1:2"})
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
    // The protocol of the empty one is that of its source, the destination being empty.
    EXPECT_EQ(registryText({"ssh", "http", "www", "split", "later", "sctponly", "finger", "empty", "ping"}),
              "8; ssh=1::2222,1000-2000 http=3::80 www=3::80 split=1::200 later=1::300 sctponly=none finger=1::79off "
              "empty=2:: ping=" +
                  std::to_string(VELDFW_SERVICE_ICMP) + "::");
    EXPECT_TRUE(log.contains("/30-again.json is skipped: an earlier file defines \"ssh\"")) << log.text();
    EXPECT_EQ(log.messages().size(), 1U) << log.text();
}

TEST(ServiceRegistry, HostileFilesAreNamedAndSkipped) {
    SystemLog log;
    writeFile("/etc/services", "");
    writeFile(directory + "good.json", definition("good", "\"1\""));
    writeFile(directory + "empty.json", "");
    writeFile(directory + "huge.json", std::string(4 << 20, ' ') + definition("huge", "\"1\""));
    makeDirectories(directory + "directory.json");
    ASSERT_EQ(mkfifo((directory + "fifo.json").c_str(), 0644), 0);
    ASSERT_EQ(symlink("nowhere", (directory + "dangling.json").c_str()), 0);
    ASSERT_EQ(symlink("/dev/zero", (directory + "device.json").c_str()), 0);
    for (const char *ignored : {"ignored.txt", ".hidden.json"})
        writeFile(directory + ignored, definition("ignored", "\"1\""));
    EXPECT_EQ(registryText({"good"}), "1; good=1::1");
    for (const char *name : {"empty", "huge", "directory", "fifo", "dangling", "device"})
        EXPECT_EQ(log.count(std::string("/") + name + ".json is skipped: "), 1U) << name << log.text();
    EXPECT_EQ(log.messages().size(), 6U) << log.text();
    removeAll(directory);
    EXPECT_EQ(registryText({"good"}), "0; good=none");
}

}  // namespace
