/* SPDX-License-Identifier: Apache-2.0 */
/* Tells whether the firewall lets a service through, and reserves a rule that does; plain functions only. */
#include <stdio.h>
#include <string.h>

#include <veldfirewall/veldfirewall_c.h>

enum { EXIT_OPEN = 0, EXIT_BLOCKED = 1, EXIT_USAGE = 2, EXIT_FAILED = 3 };

static const char usage[] =
    "usage: blocked SERVICE [ADAPTER]   is the service blocked (on one adapter, or on any)?\n"
    "       blocked --open SERVICES     let the services (a,b,...) in, on all adapters\n"
    "exit status: 0 open or done, 1 blocked, 2 usage, 3 failed (the system log has the reason)\n";

static int openServices(const char *services) {
    if (VLIBFwRuleReserveServInsert(services, 1, 1) != 0) {
        fprintf(stderr, "blocked: no rule could be reserved for %s\n", services);
        return EXIT_FAILED;
    }
    printf("%s: open\n", services);
    return EXIT_OPEN;
}

static int showState(const char *service, const char *adapter) {
    switch (VELDFwPortsCheckAllowByAdapter(adapter, service)) {
    case 1:
        printf("%s: open\n", service);
        return EXIT_OPEN;
    case 0:
        printf("%s: blocked\n", service);
        return EXIT_BLOCKED;
    default:
        fprintf(stderr, "blocked: the firewall's configuration cannot be read\n");
        return EXIT_FAILED;
    }
}

int main(int argc, char *argv[]) {
    if (argc == 2 && strcmp(argv[1], "--help") == 0) {
        fputs(usage, stdout);
        return EXIT_OPEN;
    }
    if (argc == 3 && strcmp(argv[1], "--open") == 0) {
        return openServices(argv[2]);
    }
    if (argc < 2 || argc > 3 || argv[1][0] == '-') {
        fputs(usage, stderr);
        return EXIT_USAGE;
    }
    return showState(argv[1], argc == 3 ? argv[2] : NULL);
}
