// SPDX-License-Identifier: Apache-2.0
// One run of the tool: command line, verb, exit status.
#include "frame/application.h"

#include <CLI/CLI.hpp>

#include <exception>
#include <iostream>

#include "frame/context.h"
#include "frame/errors.h"
#include "frame/libraryCall.h"
#include "verbs/verbTable.h"

namespace veldfwctl {

namespace {

int report(const std::string &text, int status) {
    std::cout.flush();
    std::cerr << "veldfwctl: " << oneLine(text) << std::endl;
    return status;
}

/// The verb as far as the command line named it, for the pointer to its help.
std::string verbNamed(const CLI::App &app) {
    std::string name = "veldfwctl";
    const CLI::App *current = &app;
    while (current != nullptr) {
        const auto chosen = current->get_subcommands();
        current = chosen.empty() ? nullptr : chosen.front();
        name += current == nullptr ? "" : " " + current->get_name();
    }
    return name;
}

}  // namespace

int applicationRun(int argc, char **argv) {
    Context context;
    context.terminalsDetect();
    systemLogOpen();

    CLI::App app("Runs, edits and explains the firewall of this machine", "veldfwctl");
    app.set_version_flag("--version", "veldfwctl " VELDFWCTL_VERSION);
    app.require_subcommand(1);
    app.footer("Exit status: 0 done, 1 the answer is no, 2 wrong usage, 3 failed.\n"
               "\"veldfwctl VERB --help\" tells more about a verb.");
    registerVerbs(app, context, argc > 1 ? argv[1] : "");
    try {
        app.parse(argc, argv);
    } catch (const CLI::Success &success) {  // --help, --version
        return app.exit(success);
    } catch (const CLI::RequiredError &error) {
        // CLI11 misses the verb before it looks at the words that are none.
        const std::string verb = verbNamed(app);
        const std::string text = error.what();
        for (int i = 1; i < argc && text.find("subcommand") != std::string::npos; ++i) {
            const std::string word = argv[i];
            if (word[0] != '-' && verb.find(" " + word) == std::string::npos) {
                return report("\"" + word + "\" is no verb of \"" + verb + "\"; see \"" + verb + " --help\"",
                              STATUS_USAGE);
            }
        }
        return report(text + "; see \"" + verb + " --help\"", STATUS_USAGE);
    } catch (const CLI::ParseError &error) {
        return report(std::string(error.what()) + "; see \"" + verbNamed(app) + " --help\"", STATUS_USAGE);
    }
    try {
        const int status = context.action();
        std::cout.flush();
        return std::cout ? status : report("Cannot write to standard output", STATUS_FAILED);
    } catch (const UsageError &error) {
        return report(error.what(), STATUS_USAGE);
    } catch (const std::exception &error) {
        return report(error.what(), STATUS_FAILED);
    }
}

}  // namespace veldfwctl
