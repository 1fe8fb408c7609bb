// SPDX-License-Identifier: Apache-2.0
// The firewall's chains as they are in the kernel.
#include "system/kernelState.h"

#include <veld/core.h>

#include <cstdio>

#include "frame/libraryCall.h"

namespace veldfwctl {

namespace {

std::string readAll(FILE *pipe) {
    std::string text;
    char buffer[4096];
    size_t count = 0;
    while ((count = fread(buffer, 1, sizeof buffer, pipe)) > 0) {
        text.append(buffer, count);
    }
    return text;
}

FILE *listingStart(const char *program) {
    return VLIBCPopen(program, "r", "-w", "-v", "-S", static_cast<char *>(nullptr));
}

}  // namespace

KernelState kernelStateRead() {
    KernelState state;
    const CallResult result = libraryCall([&state] {
        FILE *v4 = listingStart("/sbin/iptables");
        FILE *v6 = listingStart("/sbin/ip6tables");
        bool succeeded = v4 != nullptr && v6 != nullptr;
        for (const auto &[pipe, chains] : {std::pair(v4, &state.v4), std::pair(v6, &state.v6)}) {
            if (pipe != nullptr) {
                *chains = kernelChainsParse(readAll(pipe));
                succeeded = VLIBCPclose(pipe) == 0 && succeeded;
            }
        }
        return succeeded;
    });
    if (!result.succeeded) {
        state.error = result.messages.empty() ? "iptables failed" : messagesJoin(result.messages);
    }
    return state;
}

}  // namespace veldfwctl
