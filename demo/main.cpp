// SPDX-License-Identifier: Apache-2.0
// Shows the library at work: a client's connections before, while and after the firewall is on, all in a sandbox.
#include "hostState.h"
#include "sandbox.h"
#include "scenario.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <exception>
#include <sstream>
#include <string>
#include <system_error>
#include <vector>

namespace {

/// Reads to the end, and closes.
std::vector<std::string> readLines(int handle) {
    std::string text;
    std::array<char, 4096> buffer;
    ssize_t count = 0;
    while ((count = read(handle, buffer.data(), buffer.size())) > 0)
        text.append(buffer.data(), static_cast<size_t>(count));
    close(handle);
    std::vector<std::string> lines;
    std::istringstream in(text);
    for (std::string line; std::getline(in, line);)
        lines.push_back(line);
    return lines;
}

void writeLine(int handle, const std::string &text) {
    const std::string line = text + "\n";
    if (write(handle, line.data(), line.size()) != static_cast<ssize_t>(line.size()))
        throw std::system_error(errno, std::generic_category(), "report a namespace");
}

int runDemo(const std::string &buildDirectory) {
    std::array<int, 2> pipe;
    if (pipe2(pipe.data(), O_CLOEXEC) != 0)
        throw std::system_error(errno, std::generic_category(), "pipe");
    const auto before = demo::measureHost();
    const auto outside = demo::ownNamespaces();

    const auto body = [&] {
        try {
            for (const auto &space : demo::ownNamespaces())
                writeLine(pipe[1], space);
            const auto &info = veldtest::sandboxInfo();
            std::printf("Sandbox: namespaces of its own%s; \"/\" is %s\n",
                        info.userNamespace ? " through a user namespace" : "",
                        info.overlay ? "an overlay" : "a tmpfs with links to the machine's files");
            const int wrong =
                demo::runScenario(buildDirectory, [&](const std::string &space) { writeLine(pipe[1], space); });
            std::printf("\n  %d results differ from what was expected\n", wrong);
            return wrong == 0 ? 0 : 1;
        } catch (const std::exception &error) {
            std::printf("\ndemonstration: %s\n", error.what());
            return 1;
        }
    };
    const auto unavailable = [](const std::string &reason) {
        std::printf("demonstration: no sandbox: %s\n", reason.c_str());
        return 1;
    };
    int result = veldtest::runInSandbox(body, unavailable);
    close(pipe[1]);

    std::vector<std::string> made;
    for (const auto &space : readLines(pipe[0])) {
        // A namespace that the sandbox shares with this process is no new one (the user namespace, when root).
        if (std::find(outside.begin(), outside.end(), space) == outside.end())
            made.push_back(space);
    }
    std::printf("\n== This machine, before and after\n");
    if (demo::compareHost(before, demo::measureHost()) != 0)
        result = 1;
    const auto left = demo::processesIn(made);
    std::printf("  %-28s %zu processes in the %zu namespaces that were made\n", "left behind", left.size(),
                made.size());
    if (!left.empty() || made.empty())
        result = 1;
    std::printf("\n%s\n", result == 0 ? "Everything was as expected." : "NOT everything was as expected.");
    return result;
}

}  // namespace

int main(int argc, char **argv) {
    if (argc != 2) {
        std::fprintf(stderr, "usage: %s <build directory>\n", argv[0]);
        return 2;
    }
    try {
        return runDemo(argv[1]);
    } catch (const std::exception &error) {
        std::fprintf(stderr, "demonstration: %s\n", error.what());
        return 1;
    }
}
