// SPDX-License-Identifier: Apache-2.0
// "generate": the manual page and the completions, for the build. Not shown in the help text.
#include <iostream>
#include <memory>

#include "frame/verb.h"
#include "model/helpPages.h"

namespace veldfwctl {

void registerGenerate(CLI::App &app, Context &context) {
    const auto kind = std::make_shared<std::string>();
    CLI::App *verb =
        verbAdd(app, context,
                {"generate", "Print the manual page or a shell's completion", "veldfwctl generate man", [&app, kind] {
                     std::cout << (*kind == "man"    ? manualPage(app, VELDFWCTL_VERSION)
                                   : *kind == "bash" ? bashCompletion(app)
                                                     : zshCompletion(app));
                     return STATUS_DONE;
                 }});
    verb->group("");
    verb->add_option("kind", *kind, "man, bash or zsh")->required()->check(CLI::IsMember({"man", "bash", "zsh"}));
}

}  // namespace veldfwctl
