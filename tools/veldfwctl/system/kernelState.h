// SPDX-License-Identifier: Apache-2.0
// The firewall's chains as they are in the kernel.
#ifndef VELDFWCTL_KERNELSTATE_H
#define VELDFWCTL_KERNELSTATE_H

#include <future>
#include <map>
#include <string>

#include "model/kernelChains.h"
#include "system/program.h"

namespace veldfwctl {

struct KernelState {
    std::map<std::string, ChainState> v4;
    std::map<std::string, ChainState> v6;
    std::string error;  ///< why nothing is known; empty when all was read
};

/// Asks iptables and ip6tables, both at once, while the caller does something else.
class KernelStateQuery {
public:
    /// Starts the two programs.
    KernelStateQuery();
    /// Waits for what they tell. To be called once.
    KernelState answer();

private:
    std::future<ProgramOutput> v4;
    std::future<ProgramOutput> v6;
};

}  // namespace veldfwctl

#endif
