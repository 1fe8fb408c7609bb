// SPDX-License-Identifier: Apache-2.0
// Runs a fuzz target on each file of directories: the corpus as a test, with any compiler.
#include <filesystem>
#include <fstream>
#include <iostream>
#include <iterator>

#include "check.h"

extern "C" __attribute__((weak)) int LLVMFuzzerInitialize(int *argc, char ***argv);

int main(int argc, char **argv) {
    if (LLVMFuzzerInitialize != nullptr) {
        LLVMFuzzerInitialize(&argc, &argv);
    }
    int files = 0;
    for (int i = 1; i < argc; ++i) {
        for (const auto &entry : std::filesystem::directory_iterator(argv[i])) {
            std::ifstream file(entry.path(), std::ios::binary);
            const std::string text((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>());
            std::cout << entry.path().filename().string() << std::endl;  // the last one named is the one that ends it
            LLVMFuzzerTestOneInput(reinterpret_cast<const uint8_t *>(text.data()), text.size());
            ++files;
        }
    }
    std::cout << files << " files\n";
    return files > 0 ? 0 : 1;
}
