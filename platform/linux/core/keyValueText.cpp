// SPDX-License-Identifier: Apache-2.0
// The text of key/value files: lines key="value" or key=value.
#include "core/keyValueText.h"

#include <algorithm>

namespace veld {
namespace {

constexpr std::string_view kBlanks = " \t\r";

std::string_view trimmed(std::string_view text) {
    const std::size_t first = text.find_first_not_of(kBlanks);
    if (first == std::string_view::npos)
        return {};
    return text.substr(first, text.find_last_not_of(kBlanks) - first + 1);
}

// The position of the line's '=' when the line is one of that key.
std::optional<std::size_t> matchKey(std::string_view line, std::string_view key) {
    const std::string_view content = trimmed(line);
    const std::size_t equals = line.find('=');
    if (content.empty() || content.front() == '#' || equals == std::string_view::npos ||
        trimmed(line.substr(0, equals)) != key)
        return std::nullopt;
    return equals;
}

std::string_view valueIn(std::string_view afterEquals) {
    const std::string_view value = trimmed(afterEquals);
    if (!value.empty() && value.front() == '"') {
        const std::string_view quoted = value.substr(1);
        return quoted.substr(0, quoted.find('"'));
    }
    for (std::size_t i = 0; i < value.size(); ++i) {
        if (value[i] == '#' && (i == 0 || kBlanks.find(value[i - 1]) != std::string_view::npos))
            return trimmed(value.substr(0, i));
    }
    return value;
}

struct KeyLine {
    std::size_t begin;  // of the line
    std::size_t end;    // of the line, without its line break
    std::size_t equals;
};

std::optional<KeyLine> findLine(std::string_view text, std::string_view key) {
    for (std::size_t begin = 0; begin < text.size();) {
        const std::size_t end = std::min(text.find('\n', begin), text.size());
        if (const auto equals = matchKey(text.substr(begin, end - begin), key))
            return KeyLine{begin, end, begin + *equals};
        begin = end + 1;
    }
    return std::nullopt;
}

bool hasControlCharacter(std::string_view text) {
    return std::any_of(text.begin(), text.end(), [](char c) { return static_cast<unsigned char>(c) < 0x20; });
}

}  // namespace

std::optional<std::string> findKeyValue(std::string_view text, std::string_view key) {
    const auto line = findLine(text, key);
    if (!line)
        return std::nullopt;
    return std::string(valueIn(text.substr(line->equals + 1, line->end - line->equals - 1)));
}

std::string replaceKeyValue(std::string_view text, std::string_view key, std::string_view value) {
    std::string newLine(key);
    newLine.append("=\"").append(value).append("\"");
    std::string result;
    if (const auto line = findLine(text, key)) {
        const bool carriageReturn = line->end > line->begin && text[line->end - 1] == '\r';
        result.append(text.substr(0, line->begin)).append(newLine).append(carriageReturn ? "\r" : "");
        result.append(text.substr(line->end));
        return result;
    }
    result = text;
    if (!result.empty() && result.back() != '\n')
        result += '\n';
    return result.append(newLine).append("\n");
}

bool isRepresentableKey(std::string_view key) {
    return !key.empty() && trimmed(key) == key && key.front() != '#' && key.find('=') == std::string_view::npos &&
           !hasControlCharacter(key);
}

bool isRepresentableValue(std::string_view value) {
    return value.find_first_of(std::string_view("\"\r\n\0", 4)) == std::string_view::npos;
}

}  // namespace veld
