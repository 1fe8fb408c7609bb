// SPDX-License-Identifier: Apache-2.0
// Output of verbs, and questions to the person at the terminal.
#include "frame/context.h"

#include <json/writer.h>
#include <unistd.h>

#include <cstdlib>
#include <iostream>

#include "frame/errors.h"

namespace veldfwctl {

void Context::terminalsDetect() {
    outputIsTerminal = isatty(STDOUT_FILENO) != 0;
    errorIsTerminal = isatty(STDERR_FILENO) != 0;
    inputIsTerminal = isatty(STDIN_FILENO) != 0;
    const char *noColor = std::getenv("NO_COLOR");
    const char *term = std::getenv("TERM");
    colour = outputIsTerminal && (noColor == nullptr || *noColor == '\0') &&
             (term == nullptr || std::string(term) != "dumb");
}

void Context::printJson(const Json::Value &value) const {
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "  ";
    builder["emitUTF8"] = true;
    std::cout << Json::writeString(builder, value) << '\n';
}

void Context::printTable(const Table &table) const {
    std::cout << (outputIsTerminal ? tableText(table, colour) : tableFields(table));
}

void Context::print(const std::string &line) const {
    if (!json) {
        std::cout << line << '\n';
    }
}

void Context::warn(const std::string &text) const {
    std::cerr << "veldfwctl: warning: " << oneLine(text) << std::endl;
}

bool Context::confirm(const std::string &question) const {
    if (yes) {
        return true;
    }
    if (!inputIsTerminal || !errorIsTerminal) {
        throw UsageError(question + " Nobody can be asked without a terminal; say --yes to do it");
    }
    std::cout.flush();
    std::cerr << question << " [y/N] " << std::flush;
    std::string answer;
    std::getline(std::cin, answer);
    return answer == "y" || answer == "Y" || answer == "yes";
}

std::string oneLine(std::string text) {
    while (!text.empty() && text.back() == '\n') {
        text.pop_back();
    }
    for (char &c : text) {
        if (c == '\n' || c == '\r') {
            c = ' ';
        }
    }
    return text;
}

}  // namespace veldfwctl
