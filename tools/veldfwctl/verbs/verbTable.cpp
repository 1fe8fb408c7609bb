// SPDX-License-Identifier: Apache-2.0
// All verbs of the tool. Each registers itself from a file of its own.
#include "verbs/verbTable.h"

namespace veldfwctl {

#define VERB(registerVerb) void registerVerb(CLI::App &app, Context &context);
#include "verbs/verbTable.inc"
#undef VERB

void registerAllVerbs(CLI::App &app, Context &context) {
#define VERB(registerVerb) registerVerb(app, context);
#include "verbs/verbTable.inc"
#undef VERB
}

}  // namespace veldfwctl
