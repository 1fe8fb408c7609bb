// SPDX-License-Identifier: Apache-2.0
// The plain functions: arguments to strings, one or two calls, bool to int. The module functions are with their class.
#include "veldfirewall/veldfirewall_c.h"

#include <veld/core.h>

#include <boost/algorithm/string/classification.hpp>
#include <boost/algorithm/string/split.hpp>

#include <algorithm>
#include <map>
#include <string>
#include <vector>

#include "utils/log.h"
#include "utils/platformError.h"
#include "utils/runOrLog.h"
#include "veldfirewall/veldFW.h"

namespace {

constexpr int ERROR_BAD_PARAMETER = 0x0D00;
constexpr int ALLOWED = 1;
constexpr int NOT_ALLOWED = 0;
constexpr int RELOAD = 1;

// Nothing is thrown out of these functions: a C program could not catch it.
template <typename Operation> int statusOf(const Operation &operation) {
    return FW_RUN_OR_LOG(operation) ? 0 : -1;
}

}  // namespace

int VELDFwRuleHup(void) {
    return statusOf([] { return FW::VELDFW().fwUpdate() && FW::VELDFW().fwReload(true); });
}

void VELDFwReset(void) {
    FW_RUN_OR_LOG([] { return FW::VELDFW().fwReset(); });
}

int VLIBFwServRemoveRec(const char *servName) {
    if (servName == nullptr) {
        return -1;
    }
    return statusOf([&] { return FW::VELDFW_PROFILE().profileRemoveServ(servName); });
}

int VLIBFwChangeAdatper(const char *oldAdapter, const char *newAdapter, int reload) {
    if (newAdapter == nullptr) {
        return -1;
    }
    return statusOf(
        [&] { return FW::VELDFW_PROFILE().profileChangeAdapter(oldAdapter, newAdapter, reload == RELOAD); });
}

int VELDFwPortsCheckAllowByAdapter(const char *adapter, const char *servName) {
    if (servName == nullptr) {
        VLIBCErrSetEx(ERROR_BAD_PARAMETER, __FILE_NAME__, __LINE__);
        FW_LOG_ERR("Bad parameters" PLATFORM_ERROR_FORMAT, PLATFORM_ERROR_ARGUMENTS);
        return -1;
    }
    std::map<std::string, FW::FW_POLICY> verdicts;
    if (!FW_RUN_OR_LOG(
            [&] { return FW::VELDFW().fwServIsBlocked(servName, adapter == nullptr ? "" : adapter, verdicts); })) {
        FW_LOG_ERR("Failed to check %s is block or not", servName);
        return -1;
    }
    const bool allowed = std::all_of(verdicts.begin(), verdicts.end(), [](const auto &entry) {
        return entry.second == FW::FW_POLICY_ALLOW || entry.second == FW::FW_POLICY_NONE;
    });
    return allowed ? ALLOWED : NOT_ALLOWED;
}

int VLIBFwRuleReserveServInsert(const char *servList, int allow, int reload) {
    if (servList == nullptr || *servList == '\0') {
        VLIBCErrSetEx(ERROR_BAD_PARAMETER, __FILE_NAME__, __LINE__);
        return -1;
    }
    const FW::FW_POLICY policy = allow == 0 ? FW::FW_POLICY_DENY : FW::FW_POLICY_ALLOW;
    std::vector<std::string> services;
    boost::algorithm::split(services, std::string(servList), boost::algorithm::is_any_of(","),
                            boost::algorithm::token_compress_on);
    for (const std::string &service : services) {
        if (!FW_RUN_OR_LOG([&] {
                return FW::VELDFW_PROFILE().profileAddServToReserve(FW::FW_ADAPTER_GLOBAL, service, policy, false);
            })) {
            FW_LOG_ERR("Failed to assign serv [%s]", service.c_str());
            return -1;
        }
    }
    if (reload == RELOAD && !FW_RUN_OR_LOG([] { return FW::VELDFW().fwReload(true); })) {
        FW_LOG_ERR("Failed to reload firewall");
        return -1;
    }
    return 0;
}
