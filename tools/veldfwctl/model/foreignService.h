// SPDX-License-Identifier: Apache-2.0
// Services as other firewall managers define them: XML files and application profiles.
#ifndef VELDFWCTL_FOREIGNSERVICE_H
#define VELDFWCTL_FOREIGNSERVICE_H

#include <string>
#include <vector>

#include "model/numberSet.h"

namespace veldfwctl {

struct PortsByProtocol {
    NumberSet tcp;
    NumberSet udp;
};

/// What one definition says, as far as services of this firewall can say it.
struct ForeignService {
    std::string name;  ///< as the other manager calls it; empty when the file does not even tell that
    std::string file;
    PortsByProtocol source;
    PortsByProtocol destination;
    bool icmp = false;
    bool icmpv6 = false;
    bool igmp = false;
    std::vector<std::string> includes;  ///< names of services of the same manager that are part of this one
    std::vector<std::string> losses;    ///< what it says beyond that, one text each
    std::string error;                  ///< "FILE:LINE: what is wrong"; empty for one that can be used
};

/// Understands a service file in XML: <service> with <port>, <protocol>, <source-port>, <include>, <destination>,
/// <helper> and <module>. Entities and document types are not expanded.
/// @param file its path; the service has the name of the file
ForeignService serviceXmlParse(const std::string &file, const std::string &text);

/// Understands a file of application profiles: "[Name]" and below it "ports=137,138/udp|445/tcp|53". What is wrong with
/// one of them does not touch the others.
std::vector<ForeignService> applicationProfilesParse(const std::string &file, const std::string &text);

/// Whether a text is XML rather than profiles.
bool isXml(const std::string &text);

/// Adds ports, or a loss for a protocol whose ports rules cannot match.
/// @param ports "80", or a range with the given sign between first and last
/// @return what is wrong with them, or empty
std::string foreignPortsAdd(ForeignService &service, PortsByProtocol &side, const std::string &ports, char rangeSign,
                            const std::string &protocol);

}  // namespace veldfwctl

#endif
