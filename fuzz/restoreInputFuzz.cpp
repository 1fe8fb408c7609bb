// SPDX-License-Identifier: Apache-2.0
// The writer of iptables-restore's input: commands are separated by bytes 0xff; what it writes is read back as the same
// arguments, line for line.
#include "fw/restoreInput.h"

#include "check.h"
#include "restoreReader.h"

using veldfuzz::check;

namespace {

std::vector<std::string> piecesOf(std::string text) {
    std::vector<std::string> pieces;
    while (!text.empty()) {
        const std::string piece = veldfuzz::cutAt(text, ' ');
        if (!piece.empty()) {
            pieces.push_back(piece);
        }
    }
    return pieces;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    std::string rest = veldfuzz::textOf(data, size);
    FW::restoreFailedLine(rest);
    std::vector<FW::ListedCommand> commands;
    while (!rest.empty()) {
        commands.push_back({"v4", "global", 0, "/sbin/iptables " + veldfuzz::cutAt(rest, '\xff')});
    }
    FW::RestoreInput input;
    if (const auto refusal = FW::restoreInputWrite(commands, input)) {
        check(refusal->command < commands.size() && !refusal->reason.empty(), "a refusal names its command");
        return 0;
    }
    std::string table;
    size_t written = 0;
    std::string lines = input.text;
    for (size_t i = 0; i < input.commandOfLine.size(); ++i) {
        const size_t command = input.commandOfLine[i];
        const std::string line = veldfuzz::cutAt(lines, '\n');
        if (command == FW::RestoreInput::NO_COMMAND) {
            table = line[0] == '*' ? line.substr(1) : table;
            continue;
        }
        std::vector<std::string> pieces = piecesOf(commands.at(command).commandLine);
        pieces.erase(pieces.begin());
        if (pieces[0] == "-t") {
            check(pieces[1] == table, "a rule is in its table");
            pieces.erase(pieces.begin(), pieces.begin() + 2);
        } else {
            check(table == "filter", "a rule without a table is in filter");
        }
        check(veldtest::restoreArguments(line) == pieces, "the arguments are read back");
        check(input.line(i + 1) == line, "lines are counted");
        ++written;
    }
    check(lines.empty(), "no line without a command or an own purpose");
    check(written == commands.size(), "every command has its line");
    // Undoing what the input did to tables in which all its rules stood at the end.
    const std::string before = "*filter\n[0:0] -A INPUT_FIREWALL -j DROP\nCOMMIT\n";
    check(FW::restoreInputOfUndo(input, before, before).empty(), "nothing changed, nothing undone");
    check(FW::restoreInputOfUndo(input, before, input.text).find("-A INPUT_FIREWALL -j DROP") != std::string::npos ||
              input.text.find("-A INPUT_FIREWALL -j DROP\n") != std::string::npos,
          "the old rules are put back");
    FW::restoreInputOfTrial(input, before, size % (input.commandOfLine.size() + 1));
    FW::savedRulesHoldLineBreak(veldfuzz::textOf(data, size));
    return 0;
}
