// SPDX-License-Identifier: Apache-2.0
// The text of key/value files: lines key="value" or key=value.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace veld {

// The value of the first line with the key, or none. Blanks (space, tab) around key and value do not count, those
// inside quotes do. A line whose first character is '#' is a comment, and so is the rest of a line from a '#' that
// follows a blank or the closing quote. There is no escaping.
std::optional<std::string> findKeyValue(std::string_view text, std::string_view key);

// The text with the first line of the key replaced by key="value", or with such a line appended; every other line stays
// as it is, byte for byte. Key and value must be representable.
std::string replaceKeyValue(std::string_view text, std::string_view key, std::string_view value);

// Whether findKeyValue() finds again what replaceKeyValue() wrote.
bool isRepresentableKey(std::string_view key);
bool isRepresentableValue(std::string_view value);

}  // namespace veld
