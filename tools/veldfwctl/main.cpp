// SPDX-License-Identifier: Apache-2.0
// veldfwctl, the administrator's tool of the firewall.
#include "frame/application.h"

int main(int argc, char **argv) {
    return veldfwctl::applicationRun(argc, argv);
}
