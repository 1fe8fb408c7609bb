// SPDX-License-Identifier: Apache-2.0
// Opening files in directories in which other users may create names (/tmp above all): what another user planted there
// is neither followed nor trusted.
#pragma once

#include "common/uniqueFd.h"

#include <string>
#include <sys/stat.h>
#include <sys/types.h>

namespace veld {

// "/a/b" -> "/a", "/a" -> "/", "a" -> ".".
std::string parentDirectory(const std::string &path);

// True when every user may create names in the directory that holds `path`.
bool liesInSharedDirectory(const std::string &path);

// Why a file found in a shared directory is not to be trusted by the user `self`, or an empty text: it must be a
// regular file, have one name at most (a hard link can give a trusted file a new name), and belong to root or `self`.
std::string whyUntrusted(const struct stat &info, uid_t self);

// A file opened, or the reason why not.
struct OpenedFile {
    UniqueFd fd;
    struct stat info {};
    int error = 0;       // errno value when fd is invalid
    std::string reason;  // why the file at the path is not trusted; empty when it is, or when there is none

    bool untrusted() const { return !reason.empty(); }
};

// Opens an existing regular file with `flags` (O_RDONLY, O_RDWR) and never waits. With `shared` the rules above hold
// and links are not followed; an untrusted file gives EPERM and its reason.
OpenedFile openRegularFile(const std::string &path, int flags, bool shared);

// Reads the whole file: 0, or an errno value (EFBIG beyond `limit` bytes).
int readWhole(int fd, std::size_t limit, std::string &content);

// Takes an untrusted name out of the way: links and files are removed, directories (which may be full) get another
// name beside it. 0 or an errno value. The caller makes sure that no trusted file can appear meanwhile.
int removeUntrusted(const std::string &path);

// `path` with a dot and 16 random hexadecimal digits.
std::string uniqueNameBeside(const std::string &path);

}  // namespace veld
