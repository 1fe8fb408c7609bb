// SPDX-License-Identifier: Apache-2.0
// Kernel modules of iptables: which belong to a load, their order, and the record of who has them loaded.
#include "veldfirewall/veldIptablesModule.h"

#include <veld/core.h>
#include <veld/km.h>

#include <boost/algorithm/string/classification.hpp>
#include <boost/algorithm/string/join.hpp>
#include <boost/algorithm/string/split.hpp>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <initializer_list>

#include "utils/log.h"
#include "utils/platformError.h"
#include "utils/runOrLog.h"
#include "veldfirewall/utils.h"
#include "veldfirewall/veldfirewall_c.h"

namespace FW {

namespace {

constexpr const char *LIST_FILE = "/usr/veld/etc.defaults/iptables_modules_list";
constexpr const char *STATE_FILE = "/tmp/iptables_serv_mod_list";
constexpr const char *STATE_LOADED = "yes";
constexpr const char *STATE_UNLOADED = "no";
constexpr int LIST_VALUE_SIZE = 4096;
constexpr int STATE_VALUE_SIZE = 1024;
constexpr int LIST_CAPACITY = 1024;
constexpr int EXCLUSIVE = 1;
constexpr int LOCK_SECONDS = 30;

using ModuleOperation = int (*)(const char *, const VLIBCSZLIST *);

/// A string list of the platform.
struct ModuleList {
    PVLIBCSZLIST list = VLIBCSzListAlloc(LIST_CAPACITY);

    ModuleList() = default;
    ~ModuleList() { VLIBCSzListFree(list); }
    ModuleList(const ModuleList &) = delete;
    ModuleList &operator=(const ModuleList &) = delete;
};

/// The lock of the state file. Without it the state is written all the same: a switch of the firewall must not fail
/// because another process sits on the lock.
class StateLock {
public:
    StateLock() {
        const std::string path = getLockFile(STATE_FILE);
        if (VLIBCFileLockTimeByFile(path.c_str(), EXCLUSIVE, LOCK_SECONDS, &descriptor) != 1) {
            FW_LOG_ERR("Failed to get lock [%s] error[%s]", path.c_str(), std::strerror(errno));
            descriptor = -1;
            FW_LOG_ERR("Failed to get lock %s but still continue", path.c_str());
        }
    }
    ~StateLock() {
        if (descriptor != -1 && VLIBCFileUnlockByFile(descriptor) == 0) {
            FW_LOG_ERR("Failed to unlock mail config lock. ");
        }
    }
    StateLock(const StateLock &) = delete;
    StateLock &operator=(const StateLock &) = delete;

private:
    int descriptor = -1;
};

/// Reads the values of several keys, joined with blanks, as one list of modules.
bool modulesRead(std::initializer_list<const char *> keys, std::vector<std::string> &out) {
    std::string joined;
    for (const char *key : keys) {
        std::array<char, LIST_VALUE_SIZE> value = {};
        if (VLIBCFileGetKeyValue(LIST_FILE, key, value.data(), LIST_VALUE_SIZE, 0) < 1) {
            FW_LOG_ERR("Failed to get key %s from %s", key, LIST_FILE);
            return false;
        }
        joined += joined.empty() ? "" : " ";
        joined += value.data();
    }
    std::vector<std::string> modules;
    boost::algorithm::split(modules, joined, boost::algorithm::is_any_of(" "), boost::algorithm::token_compress_on);
    out = std::move(modules);
    return true;
}

std::vector<std::string> reversed(std::vector<std::string> modules) {
    std::reverse(modules.begin(), modules.end());
    return modules;
}

/// Hands the modules to the platform and then records the owner's state.
bool modulesChange(const std::string &servName, const std::vector<std::string> &modules, ModuleOperation operation,
                   const char *operationName, const char *state) {
    ModuleList list;
    if (list.list == nullptr) {
        FW_LOG_ERR("Failed to allocate list" PLATFORM_ERROR_FORMAT, PLATFORM_ERROR_ARGUMENTS);
        return false;
    }
    for (const std::string &module : modules) {
        if (VLIBCSzListPush(&list.list, module.c_str()) < 0) {
            FW_LOG_ERR("Failed to VLIBCSzListPush()");
            return false;
        }
    }
    if (operation(servName.c_str(), list.list) < 0) {
        FW_LOG_ERR("Failed to %s()", operationName);
        return false;
    }
    const StateLock lock;
    if (VLIBCFileSetKeyValue(STATE_FILE, servName.c_str(), state, 0) < 0) {
        FW_LOG_ERR("failed to set key %s to file %s" PLATFORM_ERROR_FORMAT, STATE_FILE, servName.c_str(),
                   PLATFORM_ERROR_ARGUMENTS);
        return false;
    }
    return true;
}

bool insertOrLog(const std::string &servName, const std::vector<std::string> &modules) {
    if (!VELD_IPTABLES_MODULES::moduleInsert(servName, modules)) {
        FW_LOG_ERR("Failed to moduleInsert(%s, %s)", servName.c_str(), boost::algorithm::join(modules, " ").c_str());
        return false;
    }
    return true;
}

bool removeOrLog(const std::string &servName, const std::vector<std::string> &modules) {
    if (!VELD_IPTABLES_MODULES::moduleRemove(servName, modules)) {
        FW_LOG_ERR("Failed to moduleRemove(%s, %s)", servName.c_str(), boost::algorithm::join(modules, " ").c_str());
        return false;
    }
    return true;
}

bool coreListOrLog(std::vector<std::string> &modules) {
    if (!VELD_IPTABLES_MODULES::coreCommonModuleLoad(modules)) {
        FW_LOG_ERR("Failed to coreCommonModuleLoad()");
        return false;
    }
    return true;
}

bool natListOrLog(std::vector<std::string> &modules) {
    if (!VELD_IPTABLES_MODULES::natModuleLoad(modules)) {
        FW_LOG_ERR("Failed to natModuleLoad()");
        return false;
    }
    return true;
}

}  // namespace

bool VELD_IPTABLES_MODULES::moduleInsert(const std::string &servName, const std::vector<std::string> &modules) {
    return modulesChange(servName, modules, VLIBIptablesModInsert, "VLIBIptablesModInsert", STATE_LOADED);
}

bool VELD_IPTABLES_MODULES::moduleRemove(const std::string &servName, const std::vector<std::string> &modules) {
    return modulesChange(servName, modules, VLIBIptablesModRemove, "VLIBIptablesModRemove", STATE_UNLOADED);
}

bool VELD_IPTABLES_MODULES::isModuleLoad(const std::string &servName) {
    if (VLIBCFileExist(STATE_FILE) == 0) {
        return false;
    }
    std::array<char, STATE_VALUE_SIZE> value = {};
    if (VLIBCFileGetKeyValue(STATE_FILE, servName.c_str(), value.data(), STATE_VALUE_SIZE, 0) < 0) {
        FW_LOG_ERR("failed to get key %s from file %s" PLATFORM_ERROR_FORMAT, STATE_FILE, servName.c_str(),
                   PLATFORM_ERROR_ARGUMENTS);
        return false;
    }
    return std::strcmp(value.data(), STATE_LOADED) == 0;
}

bool VELD_IPTABLES_MODULES::coreCommonModuleLoad(std::vector<std::string> &out) {
    return modulesRead({"KERNEL_MODULES_CORE", "KERNEL_MODULES_COMMON", "IPV6_MODULES"}, out);
}

bool VELD_IPTABLES_MODULES::natModuleLoad(std::vector<std::string> &out) {
    return modulesRead({"KERNEL_MODULES_NAT"}, out);
}

bool VELD_IPTABLES_MODULES::iptablesModListGet(const std::string &key, std::vector<std::string> &out) {
    return modulesRead({key.c_str()}, out);
}

bool VELD_IPTABLES_MODULES::iptablesCoreModLoad(const std::string &servName) {
    std::vector<std::string> core;
    return coreListOrLog(core) && insertOrLog(servName, core);
}

bool VELD_IPTABLES_MODULES::iptablesCoreModUnload(const std::string &servName) {
    std::vector<std::string> core;
    return coreListOrLog(core) && removeOrLog(servName, reversed(core));
}

bool VELD_IPTABLES_MODULES::iptablesNATModLoad(const std::string &servName) {
    std::vector<std::string> core;
    std::vector<std::string> nat;
    return coreListOrLog(core) && natListOrLog(nat) && insertOrLog(servName, core) && insertOrLog(servName, nat);
}

bool VELD_IPTABLES_MODULES::iptablesNATModUnload(const std::string &servName) {
    std::vector<std::string> core;
    std::vector<std::string> nat;
    return coreListOrLog(core) && natListOrLog(nat) && removeOrLog(servName, reversed(nat)) &&
           removeOrLog(servName, reversed(core));
}

}  // namespace FW

namespace {

int moduleCall(bool (*operation)(const std::string &), const char *servName) {
    if (servName == nullptr) {
        FW_LOG_ERR("servName is NULL");
        return -1;
    }
    return FW_RUN_OR_LOG([&] { return operation(servName); }) ? 0 : -1;
}

}  // namespace

int VELDIptablesCodeModeLoad(const char *servName) {
    return moduleCall(FW::VELD_IPTABLES_MODULES::iptablesCoreModLoad, servName);
}

int VELDIptablesCoreModUnload(const char *servName) {
    return moduleCall(FW::VELD_IPTABLES_MODULES::iptablesCoreModUnload, servName);
}

int VELDIptablesNATModLoad(const char *servName) {
    return moduleCall(FW::VELD_IPTABLES_MODULES::iptablesNATModLoad, servName);
}

int VELDIptablesNATModUnload(const char *servName) {
    return moduleCall(FW::VELD_IPTABLES_MODULES::iptablesNATModUnload, servName);
}
