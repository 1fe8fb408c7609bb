// SPDX-License-Identifier: Apache-2.0
// Adds verbs to the command line.
#include "frame/verb.h"

#include <sstream>

namespace veldfwctl {

CLI::App *verbAdd(CLI::App &parent, Context &context, const Verb &verb) {
    CLI::App *app = parent.add_subcommand(verb.name, verb.summary);
    std::istringstream lines(verb.example);
    std::string footer = verb.description.empty() ? "Example:" : verb.description + "\n\nExample:";
    for (std::string line; std::getline(lines, line);) {
        footer += "\n  " + line;
    }
    app->footer(footer);
    app->add_flag("--json", context.json, "Print the result as a JSON document");
    if (verb.asksForConsent) {
        app->add_flag("-y,--yes", context.yes, "Do not ask; needed where there is no terminal");
    }
    app->callback([&context, run = verb.run] { context.action = run; });
    return app;
}

CLI::App *verbGroupAdd(CLI::App &parent, const std::string &name, const std::string &summary) {
    CLI::App *app = parent.add_subcommand(name, summary);
    app->require_subcommand(1);
    return app;
}

}  // namespace veldfwctl
