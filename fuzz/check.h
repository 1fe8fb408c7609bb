// SPDX-License-Identifier: Apache-2.0
// What the fuzz targets share: ending at a finding, and drawing values from the input.
#ifndef VELD_FUZZ_CHECK_H
#define VELD_FUZZ_CHECK_H

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <vector>

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size);

namespace veldfuzz {

/// Ends the process, with the text, unless the promise is kept.
inline void check(bool isKept, const char *promise) {
    if (!isKept) {
        std::fprintf(stderr, "broken: %s\n", promise);
        std::abort();
    }
}

inline std::string textOf(const uint8_t *data, size_t size) {
    return {reinterpret_cast<const char *>(data), size};
}

/// The text up to the first `separator`, which is taken off `rest` with it.
inline std::string cutAt(std::string &rest, char separator) {
    const size_t end = rest.find(separator);
    std::string head = rest.substr(0, end);
    rest = end == std::string::npos ? "" : rest.substr(end + 1);
    return head;
}

/// Small numbers from the bytes of the input; 0 when they are used up.
class Bytes {
public:
    Bytes(const uint8_t *bytes, size_t size) : data(bytes), left(size) {}

    bool isEmpty() const { return left == 0; }
    uint8_t next() {
        if (left == 0) {
            return 0;
        }
        --left;
        return *data++;
    }
    int below(int limit) { return next() % limit; }
    template <typename Value> Value oneOf(const std::vector<Value> &values) { return values[next() % values.size()]; }

private:
    const uint8_t *data;
    size_t left;
};

}  // namespace veldfuzz

#endif
