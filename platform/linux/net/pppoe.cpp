// SPDX-License-Identifier: Apache-2.0
// VELDPPPoeIntfGet(): the interface of the PPPoE link, as pppd wrote it to its pid file.
#include "veld/net.h"

#include "common/log.h"
#include "common/trustedFile.h"

#include <fcntl.h>

namespace {

// pppd's file for "linkname pppoe": its process number, then its interface.
constexpr char kPidFile[] = "/run/ppp-pppoe.pid";
constexpr std::size_t kLargestPidFile = 4096;

std::string secondLine(const std::string &content) {
    const std::size_t end = content.find('\n');
    if (end == std::string::npos)
        return {};
    return content.substr(end + 1, content.find('\n', end + 1) - end - 1);
}

}  // namespace

int VELDPPPoeIntfGet(char *buf, int size) {
    return veld::guarded(__func__, -1, [&] {
        if (buf == nullptr || size < 1) {
            VELD_SET_ERROR(veld::kBadParameter);
            return -1;
        }
        buf[0] = '\0';
        veld::OpenedFile file = veld::openRegularFile(kPidFile, O_RDONLY, veld::liesInSharedDirectory(kPidFile));
        std::string content;
        int error = file.fd ? veld::readWhole(file.fd.get(), kLargestPidFile, content) : file.error;
        const std::string name = secondLine(content);
        if (error == 0 && (name.empty() || if_nametoindex(name.c_str()) == 0))
            error = ENODEV;  // pppd is between two connections, or was killed and left its file
        if (error == 0 && name.size() >= static_cast<std::size_t>(size))
            error = ENOSPC;
        if (error != 0) {
            VELD_SET_ERROR(veld::systemErrorCode(error));
            return -1;
        }
        name.copy(buf, name.size());
        buf[name.size()] = '\0';
        return static_cast<int>(name.size());
    });
}
