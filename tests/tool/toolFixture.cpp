// SPDX-License-Identifier: Apache-2.0
// A sandbox with a small configuration, in which the tool runs.
#include "toolFixture.h"

#include <json/reader.h>

#include <filesystem>
#include <memory>
#include <stdexcept>

#include "files.h"
#include "network.h"

namespace veldtest {

namespace {

constexpr const char *PROFILES = "/usr/veld/etc/firewall.d/";

constexpr const char *DEFAULT_PROFILE = R"({"name": "default", "adapterPolicyMap": {"eth0": 1, "global": 2}, "rules": {
  "eth0": [{"name": "web", "enable": true, "adapterDirect": 1, "protocol": 3, "policy": 0, "blLog": false,
            "table": "filter", "ipType": 2, "ipDirect": 1, "ipGroup": 5, "ipList": [], "portDirect": 0, "portGroup": 0,
            "portList": ["http", "https"]}]}})";

/// Records of a country file: pairs of words in the machine's own byte order.
std::string words(const std::vector<uint32_t> &values) {
    return {reinterpret_cast<const char *>(values.data()), values.size() * sizeof(uint32_t)};
}

}  // namespace

void ToolTest::SetUp() {
    writeFile(std::string(PROFILES) + "1.json", DEFAULT_PROFILE);
    writeFile(std::string(PROFILES) + "2.json", R"({"name": "office", "adapterPolicyMap": null, "rules": null})");
    writeFile(std::string(PROFILES) + "firewall_settings.json", R"({"status": false, "profile": "default"})");
    for (const auto &entry : std::filesystem::directory_iterator(std::string(VELD_DATA_DIR) + "/services.d")) {
        writeFile("/usr/veld/etc/services.d/" + entry.path().filename().string(), readFile(entry.path()));
    }
    writeFile("/usr/veld/etc/services.d/fax.json",
              R"({"name": "fax", "enabled": false, "source": {"protocol": "tcp", "ports": []},
                  "destination": {"protocol": "tcp", "ports": ["4559"]}})");
    // Modules that no kernel knows, so that none is loaded.
    writeFile("/usr/veld/etc.defaults/iptables_modules_list", "KERNEL_MODULES_CORE=\"test_core.ko\"\n"
                                                              "KERNEL_MODULES_COMMON=\"test_common.ko\"\n"
                                                              "IPV6_MODULES=\"test_v6.ko\"\n");
    writeFile("/usr/share/xt_geoip/DE.iv4", words({0x0A000000, 0x0A0001FF, 0xC0000200, 0xC0000202}));
    writeFile("/usr/share/xt_geoip/DE.iv6", words({0x20010DB8, 0, 0, 0, 0x20010DB8, 0, 0, 0xF}));
    writeFile("/usr/share/xt_geoip/FR.iv4", words({0xC6336400, 0xC63364FF}));
    addDummyInterface("eth0");
}

ProgramResult runTool(const std::vector<std::string> &arguments) {
    std::vector<std::string> command = {VELDFWCTL};
    command.insert(command.end(), arguments.begin(), arguments.end());
    return runProgram(command);
}

Json::Value parseJson(const std::string &text) {
    Json::Value value;
    std::string errors;
    const std::unique_ptr<Json::CharReader> reader(Json::CharReaderBuilder().newCharReader());
    if (!reader->parse(text.data(), text.data() + text.size(), &value, &errors)) {
        throw std::runtime_error("no JSON: " + errors + ": " + text);
    }
    return value;
}

Json::Value storedProfile(const std::string &name) {
    for (const std::string &file : listDirectory(PROFILES)) {
        Json::Value document = parseJson(readFile(PROFILES + file));
        if (document["name"] == name) {
            return document;
        }
    }
    return {};
}

}  // namespace veldtest
