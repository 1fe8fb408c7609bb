// SPDX-License-Identifier: Apache-2.0
// One run of the tool.
#ifndef VELDFWCTL_APPLICATION_H
#define VELDFWCTL_APPLICATION_H

namespace veldfwctl {

/// Understands the command line, runs the verb and reports errors, one line each, on standard error.
/// @return the exit status (see ExitStatus)
int applicationRun(int argc, char **argv);

}  // namespace veldfwctl

#endif
