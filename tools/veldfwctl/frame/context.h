// SPDX-License-Identifier: Apache-2.0
// What every verb is given: where its output goes and what the command line said about it.
#ifndef VELDFWCTL_CONTEXT_H
#define VELDFWCTL_CONTEXT_H

#include <json/value.h>

#include <functional>
#include <string>

#include "model/table.h"

namespace veldfwctl {

/// Made once by main(), which also runs `action` after the whole command line was understood.
struct Context {
    bool json = false;              ///< --json: one JSON document on standard output and nothing else
    bool yes = false;               ///< --yes: answers every question of confirm()
    bool outputIsTerminal = false;  ///< tables with headings instead of lines of tab-separated fields
    bool colour = false;            ///< standard output takes colours
    bool errorIsTerminal = false;   ///< standard error can show progress
    bool inputIsTerminal = false;   ///< somebody can answer questions
    std::function<int()> action;    ///< set by the verb that was named; gives an ExitStatus

    /// Fills the fields that depend on the terminal and the environment (NO_COLOR, TERM).
    void terminalsDetect();
    /// Writes the result of a --json run to standard output.
    void printJson(const Json::Value &value) const;
    /// Writes a table: aligned under headings on a terminal, else a line of tab-separated fields per row.
    void printTable(const Table &table) const;
    /// Writes a line to standard output, unless --json was given.
    void print(const std::string &line) const;
    /// Writes "veldfwctl: warning: ..." to standard error; what was asked for is done all the same.
    void warn(const std::string &text) const;
    /// Asks a yes-or-no question on the terminal. With --yes the answer is yes.
    /// @throws UsageError when nobody can be asked: the job wants --yes then
    bool confirm(const std::string &question) const;
};

/// Puts text into one line: line breaks become blanks.
std::string oneLine(std::string text);

}  // namespace veldfwctl

#endif
