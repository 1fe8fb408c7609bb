// SPDX-License-Identifier: Apache-2.0
// How far a list of commands has been run, and how that is shown.
#include "model/progressText.h"

#include <algorithm>

namespace veldfwctl {

size_t commandsDone(const std::vector<std::string> &commands, size_t done, const std::string &running) {
    const auto from = commands.begin() + static_cast<std::ptrdiff_t>(std::min(done, commands.size()));
    const auto found = std::find(from, commands.end(), running);
    return found == commands.end() ? done : static_cast<size_t>(found - commands.begin());
}

std::string progressLine(const std::string &what, size_t done, size_t total, int seconds, size_t width) {
    constexpr size_t MARKS = 30;
    std::string line = what + "  ";
    if (total > 0) {
        const size_t full = MARKS * std::min(done, total) / total;
        const std::string bar = "[" + std::string(full, '#') + std::string(MARKS - full, '.') + "]  ";
        const std::string count = std::to_string(done) + " of " + std::to_string(total) + " commands, ";
        line += (line.size() + bar.size() + count.size() + 8 < width ? bar : "") + count;
    }
    line += std::to_string(seconds) + " s";
    return line.substr(0, width > 0 ? width - 1 : 0);
}

}  // namespace veldfwctl
