// SPDX-License-Identifier: Apache-2.0
// The firewall's chains as they are in the kernel.
#include "system/kernelState.h"

namespace veldfwctl {

namespace {

std::future<ProgramOutput> listingStart(const char *program) {
    return std::async(std::launch::async, [program] { return programRun({program, "-w", "10", "-v", "-S"}); });
}

}  // namespace

KernelStateQuery::KernelStateQuery() : v4(listingStart(IPTABLES)), v6(listingStart(IP6TABLES)) {}

KernelState KernelStateQuery::answer() {
    KernelState state;
    const ProgramOutput outputV4 = v4.get();
    const ProgramOutput outputV6 = v6.get();
    for (const auto &[program, output, chains] :
         {std::tuple(IPTABLES, &outputV4, &state.v4), std::tuple(IP6TABLES, &outputV6, &state.v6)}) {
        if (output->succeeded()) {
            *chains = kernelChainsParse(output->output);
        } else {
            state.error += (state.error.empty() ? "" : "; ") + std::string(program) + ": " + output->reason();
        }
    }
    return state;
}

}  // namespace veldfwctl
