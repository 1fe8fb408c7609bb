// SPDX-License-Identifier: Apache-2.0
// Tables of test cases in files: a case per line, columns between "|"; lines that start with "#" are comments.
#ifndef VELD_TEST_CASE_TABLE_H
#define VELD_TEST_CASE_TABLE_H

#include <string>
#include <vector>

namespace veldtest {

/// The cases of a file, without the blanks around the columns. Throws std::runtime_error when there is none, or when
/// one has another number of columns.
std::vector<std::vector<std::string>> readCases(const std::string &path, size_t columns);
/// The parts of a text between separators; none of an empty text.
std::vector<std::string> split(const std::string &text, char separator);

}  // namespace veldtest

#endif
