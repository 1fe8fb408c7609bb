// SPDX-License-Identifier: Apache-2.0
// Counts how often the files of a directory are opened.
#ifndef VELD_TEST_OPEN_COUNTER_H
#define VELD_TEST_OPEN_COUNTER_H

#include <map>
#include <string>

namespace veldtest {

/// Counts from its making on. Does not see what is opened in further directories.
class OpenCounter {
public:
    explicit OpenCounter(const std::string &directory);
    ~OpenCounter();
    OpenCounter(const OpenCounter &) = delete;
    OpenCounter &operator=(const OpenCounter &) = delete;

    /// The counts by file name since the last call.
    std::map<std::string, int> take();

private:
    int m_handle;
};

}  // namespace veldtest

#endif
