// SPDX-License-Identifier: Apache-2.0
// Files in the sandbox. What writes throws std::logic_error outside of one, std::system_error when it fails.
#ifndef VELD_TEST_FILES_H
#define VELD_TEST_FILES_H

#include <sys/types.h>

#include <string>
#include <vector>

namespace veldtest {

/// Replaces `path`, also when it is a link, with a file of that text; makes the directories that are missing.
void writeFile(const std::string &path, const std::string &text, mode_t mode = 0644);
/// Text of a file.
std::string readFile(const std::string &path);
/// Makes a directory and its parents; nothing happens when it exists.
void makeDirectories(const std::string &path, mode_t mode = 0755);
/// Copies a program to `path`, replacing what is there, and makes it executable.
void installProgram(const std::string &source, const std::string &path);
/// Names in a directory, sorted; empty when there is none.
std::vector<std::string> listDirectory(const std::string &path);
/// Whether something of that name exists (also a link that leads nowhere).
bool pathExists(const std::string &path);
/// Removes a file or a directory with all that is in it.
void removeAll(const std::string &path);

}  // namespace veldtest

#endif
