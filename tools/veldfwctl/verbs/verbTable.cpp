// SPDX-License-Identifier: Apache-2.0
// All verbs of the tool. Each registers itself from a file of its own.
#include "verbs/verbTable.h"

#include <algorithm>
#include <iterator>
#include <string_view>

namespace veldfwctl {

#define VERB(name, registerVerb) void registerVerb(CLI::App &app, Context &context);
#include "verbs/verbTable.inc"
#undef VERB

namespace {

struct VerbEntry {
    std::string_view name;
    void (*add)(CLI::App &, Context &);
};

constexpr VerbEntry VERBS[] = {
#define VERB(name, registerVerb) {#name, registerVerb},
#include "verbs/verbTable.inc"
#undef VERB
};

}  // namespace

void registerVerbs(CLI::App &app, Context &context, const std::string &word) {
    const auto named =
        std::find_if(std::begin(VERBS), std::end(VERBS), [&word](const VerbEntry &verb) { return verb.name == word; });
    if (named != std::end(VERBS) && named->name != "generate") {
        named->add(app, context);
        return;
    }
    for (const VerbEntry &verb : VERBS) {
        verb.add(app, context);
    }
}

}  // namespace veldfwctl
