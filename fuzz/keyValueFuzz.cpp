// SPDX-License-Identifier: Apache-2.0
// Key/value text. The input is: key, value and another key, each ended by a zero byte, then the text.
#include "core/keyValueText.h"

#include "check.h"

using veldfuzz::check;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    std::string text = veldfuzz::textOf(data, size);
    const std::string key = veldfuzz::cutAt(text, '\0');
    const std::string value = veldfuzz::cutAt(text, '\0');
    const std::string other = veldfuzz::cutAt(text, '\0');
    veld::findKeyValue(text, key);
    if (!veld::isRepresentableKey(key) || !veld::isRepresentableValue(value)) {
        return 0;
    }
    const std::string replaced = veld::replaceKeyValue(text, key, value);
    check(veld::findKeyValue(replaced, key) == value, "the value is found again");
    check(veld::replaceKeyValue(replaced, key, value) == replaced, "written twice is written once");
    if (other != key && veld::isRepresentableKey(other)) {
        check(veld::findKeyValue(replaced, other) == veld::findKeyValue(text, other), "other keys keep their values");
    }
    return 0;
}
