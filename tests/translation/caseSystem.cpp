// SPDX-License-Identifier: Apache-2.0
// Makes the sandbox look as a translation case says.
#include "caseSystem.h"

#include <json/json.h>

#include <sstream>

#include "files.h"
#include "network.h"

namespace veldtest {
namespace {

constexpr const char *TOOL = "/usr/veld/sbin/veldnetdtool";
constexpr const char *TOOL_RUNS = "/run/network-tool/runs";
// Prints the answer for the interface, or the interface itself, and notes its arguments.
constexpr const char *TOOL_SCRIPT =
    "#!/bin/sh\n"
    "echo \"$*\" >> /run/network-tool/runs\n"
    "[ -e \"/run/network-tool/answer.$2\" ] && exec cat \"/run/network-tool/answer.$2\"\n"
    "printf %s \"$2\"\n";

std::string toJson(const CaseService &service) {
    Json::Value json;
    json["name"] = service.name;
    json["enabled"] = service.enabled;
    for (const auto &[side, list] : service.sides) {
        json[side]["protocol"] = list.first;
        json[side]["ports"] = Json::Value(Json::arrayValue);
        for (const std::string &port : list.second)
            json[side]["ports"].append(port);
    }
    return json.toStyledString();
}

}  // namespace

CaseSystem::CaseSystem(const TranslationCase &wanted) : m_interfaces(wanted.interfaces) {
    for (const char *left :
         {"/run/network-tool", "/usr/veld/etc/services.d", "/usr/share/xt_geoip", TOOL, "/run/ppp-pppoe.pid"})
        removeAll(left);
    for (const std::string &name : m_interfaces)
        addDummyInterface(name);
    if (!wanted.pppoeInterface.empty())
        writeFile("/run/ppp-pppoe.pid", "4711\n" + wanted.pppoeInterface + "\n");
    writeFile("/etc.defaults/veldinfo.conf", wanted.wireless ? "support_wireless=\"yes\"\n" : "");
    // Names that the machine's own services database knows must not come in.
    writeFile("/etc/services", wanted.serviceRegistryEmpty ? "" : "discard 9/tcp\n");
    for (const CaseService &service : wanted.services)
        writeFile("/usr/veld/etc/services.d/" + service.name + ".json", toJson(service));
    for (const auto &[name, size] : wanted.geoipFiles)
        writeFile("/usr/share/xt_geoip/" + name, std::string(size, '\1'));
    makeDirectories("/run/network-tool");
    for (const auto &[name, answer] : wanted.tunnelAnswers)
        writeFile("/run/network-tool/answer." + name, answer);
    if (!wanted.networkToolMissing)
        writeFile(TOOL, TOOL_SCRIPT, 0755);
}

CaseSystem::~CaseSystem() {
    for (const std::string &name : m_interfaces)
        runProgram({"ip", "link", "del", name});
}

std::vector<std::string> CaseSystem::toolRuns() {
    std::vector<std::string> runs;
    std::istringstream lines(pathExists(TOOL_RUNS) ? readFile(TOOL_RUNS) : "");
    for (std::string line; std::getline(lines, line);)
        runs.push_back(line);
    return runs;
}

}  // namespace veldtest
