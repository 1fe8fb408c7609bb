// SPDX-License-Identifier: Apache-2.0
// Tables of test cases in files.
#include "caseTable.h"

#include <fstream>
#include <sstream>
#include <stdexcept>

namespace veldtest {

std::vector<std::string> split(const std::string &text, char separator) {
    std::vector<std::string> parts;
    std::istringstream rest(text);
    for (std::string part; std::getline(rest, part, separator);)
        parts.push_back(part);
    return parts;
}

std::vector<std::vector<std::string>> readCases(const std::string &path, size_t columns) {
    std::vector<std::vector<std::string>> cases;
    std::ifstream file(path);
    for (std::string line; std::getline(file, line);) {
        if (line.empty() || line[0] == '#')
            continue;
        std::vector<std::string> cells = split(line + " ", '|');
        if (cells.size() != columns)
            throw std::runtime_error(path + ": not " + std::to_string(columns) + " columns: " + line);
        for (std::string &cell : cells) {
            cell.erase(0, cell.find_first_not_of(' '));
            cell.erase(cell.find_last_not_of(' ') + 1);
        }
        cases.push_back(cells);
    }
    if (cases.empty())
        throw std::runtime_error(path + ": no cases");
    return cases;
}

}  // namespace veldtest
