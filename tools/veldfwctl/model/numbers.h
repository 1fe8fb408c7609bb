// SPDX-License-Identifier: Apache-2.0
// Numbers and lists in text.
#ifndef VELDFWCTL_NUMBERS_H
#define VELDFWCTL_NUMBERS_H

#include <charconv>
#include <optional>
#include <string>
#include <vector>

namespace veldfwctl {

/// A decimal number that is the whole text and lies within the bounds.
inline std::optional<int> numberParse(const std::string &text, int lowest, int highest) {
    int value = 0;
    const char *end = text.data() + text.size();
    const auto [stopped, error] = std::from_chars(text.data(), end, value);
    if (error != std::errc() || stopped != end || value < lowest || value > highest || text[0] == '-') {
        return std::nullopt;
    }
    return value;
}

/// The pieces between the separators; one empty piece for an empty text.
inline std::vector<std::string> split(const std::string &text, char separator) {
    std::vector<std::string> pieces(1);
    for (const char c : text) {
        if (c == separator) {
            pieces.emplace_back();
        } else {
            pieces.back() += c;
        }
    }
    return pieces;
}

inline std::string join(const std::vector<std::string> &pieces, const std::string &separator) {
    std::string text;
    for (const std::string &piece : pieces) {
        text += (text.empty() ? "" : separator) + piece;
    }
    return text;
}

}  // namespace veldfwctl

#endif
