// SPDX-License-Identifier: Apache-2.0
// Characters of test cases that a line of a table cannot hold.
#ifndef VELD_TEST_TEXT_ESCAPES_H
#define VELD_TEST_TEXT_ESCAPES_H

#include <string>

namespace veldtest {

/// Replaces "\n", "\t", "\r", "\v", "\f", "\\" and "\xNN".
inline std::string unescaped(const std::string &text) {
    const std::string letters = "ntrvf\\";
    std::string plain;
    for (size_t i = 0; i < text.size(); ++i) {
        const size_t letter = text[i] == '\\' && i + 1 < text.size() ? letters.find(text[i + 1]) : std::string::npos;
        if (letter != std::string::npos) {
            plain += "\n\t\r\v\f\\"[letter];
            ++i;
        } else if (text.compare(i, 2, "\\x") == 0) {
            plain += static_cast<char>(std::stoi(text.substr(i + 2, 2), nullptr, 16));
            i += 3;
        } else {
            plain += text[i];
        }
    }
    return plain;
}

}  // namespace veldtest

#endif
