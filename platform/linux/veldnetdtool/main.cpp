// SPDX-License-Identifier: Apache-2.0
// The network tool: answers questions about the network on standard output.
#include "net/tunnelChoice.h"

#include <cstdio>
#include <cstring>
#include <string_view>

namespace {

constexpr int kUsageError = 2;

int fail(const char *what, int error) {
    (void)fprintf(stderr, "veldnetdtool: the kernel does not tell its %s: %s\n", what, strerror(error));
    return 1;
}

}  // namespace

int main(int argc, char *argv[]) {
    if (argc != 3 || std::string_view(argv[1]) != "--get-ipv6-router-interface" || *argv[2] == '\0') {
        (void)fputs("usage: veldnetdtool --get-ipv6-router-interface INTERFACE\n"
                    "Prints, without a newline, the 6in4 (sit) tunnel whose local address belongs to INTERFACE,\n"
                    "or INTERFACE when there is none.\n",
                    stderr);
        return kUsageError;
    }
    std::vector<veld::Link> links;
    std::vector<veld::LinkAddress> addresses;
    if (const int error = veld::readLinks(links); error != 0)
        return fail("interfaces", error);
    if (const int error = veld::readAddresses(addresses); error != 0)
        return fail("addresses", error);
    const std::string name = veld::ipv6RouterInterface(argv[2], links, addresses);
    if (fputs(name.c_str(), stdout) < 0 || fflush(stdout) != 0) {
        perror("veldnetdtool: standard output");
        return 1;
    }
    return 0;
}
