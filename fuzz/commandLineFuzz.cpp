// SPDX-License-Identifier: Apache-2.0
// The splitter of command lines: the pieces between spaces, or a refusal beyond its limits.
#include "fw/commandLine.h"

#include "check.h"

using veldfuzz::check;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    const std::string line = veldfuzz::textOf(data, size);
    std::vector<std::string> pieces;
    size_t needed = 0;
    for (std::string rest = line; !rest.empty();) {
        const std::string piece = veldfuzz::cutAt(rest, ' ');
        if (!piece.empty()) {
            pieces.push_back(piece);
            needed += piece.size() + 1;
        }
    }
    FW::CommandArguments arguments;
    const FW::CommandSplit outcome = FW::commandLineSplit(line, arguments);
    const bool fits = !pieces.empty() && pieces.size() <= 255 && needed <= 1024;
    check((outcome == FW::CommandSplit::OK) == fits, "what fits is split, and nothing else");
    if (fits) {
        check(arguments.count == pieces.size(), "as many arguments as pieces");
        check(arguments.vector.at(arguments.count) == nullptr, "the vector is ended");
        for (size_t i = 0; i < pieces.size(); ++i) {
            check(std::string(arguments.vector.at(i)) == pieces[i].c_str(), "the arguments are the pieces");
        }
    }
    return 0;
}
