/* SPDX-License-Identifier: Apache-2.0 */
/* Asks whether the firewall lets a service through, and keeps rules for services; plain functions only. */
#include <stdio.h>
#include <string.h>

#include <veldfirewall/veldfirewall_c.h>

enum { EXIT_OPEN = 0, EXIT_BLOCKED = 1, EXIT_USAGE = 2, EXIT_FAILED = 3 };

static const char usage[] =
    "usage: blocked SERVICE [ADAPTER]        is the service blocked (on one adapter, or on any)?\n"
    "       blocked --allow SERVICES         let the services (a,b,...) in, on all adapters\n"
    "       blocked --deny SERVICES          keep them out\n"
    "       blocked --forget SERVICE         take the service out of all rules\n"
    "       blocked --rename ADAPTER NEW     move an adapter's rules to another name\n"
    "       blocked --update                 follow the services that the system has now\n"
    "       blocked --load OWNER [nat]       load kernel modules on behalf of OWNER\n"
    "       blocked --unload OWNER [nat]     and unload them\n"
    "       blocked --off                    switch the firewall off\n"
    "exit status: 0 open or done, 1 blocked, 2 usage, 3 failed (the system log has the reason)\n";

static int show(const char *service, const char *adapter) {
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

/* Sets `result` to what the function of a command returned; 0 when there is no such command. */
static int run(const char *command, const char *first, const char *second, int *result) {
    const int nat = second != NULL && strcmp(second, "nat") == 0;
    if (first != NULL && second == NULL && strcmp(command, "--allow") == 0) {
        *result = VLIBFwRuleReserveServInsert(first, 1, 1);
    } else if (first != NULL && second == NULL && strcmp(command, "--deny") == 0) {
        *result = VLIBFwRuleReserveServInsert(first, 0, 1);
    } else if (first != NULL && second == NULL && strcmp(command, "--forget") == 0) {
        *result = VLIBFwServRemoveRec(first);
    } else if (second != NULL && strcmp(command, "--rename") == 0) {
        *result = VLIBFwChangeAdatper(first, second, 1);
    } else if (first == NULL && strcmp(command, "--update") == 0) {
        *result = VELDFwRuleHup();
    } else if (first != NULL && (second == NULL || nat) && strcmp(command, "--load") == 0) {
        *result = nat ? VELDIptablesNATModLoad(first) : VELDIptablesCodeModeLoad(first);
    } else if (first != NULL && (second == NULL || nat) && strcmp(command, "--unload") == 0) {
        *result = nat ? VELDIptablesNATModUnload(first) : VELDIptablesCoreModUnload(first);
    } else if (first == NULL && strcmp(command, "--off") == 0) {
        VELDFwReset();
        *result = 0;
    } else {
        return 0;
    }
    return 1;
}

int main(int argc, char *argv[]) {
    const char *first = argc > 2 ? argv[2] : NULL;
    const char *second = argc > 3 ? argv[3] : NULL;
    int result = 0;

    if (argc == 2 && strcmp(argv[1], "--help") == 0) {
        fputs(usage, stdout);
        return EXIT_OPEN;
    }
    if ((argc == 2 || argc == 3) && argv[1][0] != '-') {
        return show(argv[1], first);
    }
    if (argc < 2 || argc > 4 || !run(argv[1], first, second, &result)) {
        fputs(usage, stderr);
        return EXIT_USAGE;
    }
    if (result != 0) {
        fprintf(stderr, "blocked: %s failed\n", argv[1]);
        return EXIT_FAILED;
    }
    return EXIT_OPEN;
}
