// SPDX-License-Identifier: Apache-2.0
// Service definitions: read with usable ports only, or refused with a reason; never an exception.
#include "check.h"
#include "serviceconf/serviceDefinition.h"

using veldfuzz::check;

namespace {

bool isPort(const std::string &text) {
    return !text.empty() && text.size() <= 5 && text[0] != '0' &&
           text.find_first_not_of("0123456789") == std::string::npos && std::stoi(text) <= 65535;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    const std::string text = veldfuzz::textOf(data, size);
    std::string rest = text;
    const std::string first = veldfuzz::cutAt(rest, '-');
    const bool isRange = first.size() < text.size();
    check(veld::isPortEntry(text) ==
              (isPort(first) && (!isRange || (isPort(rest) && std::stoi(first) <= std::stoi(rest)))),
          "a port or a range");
    veld::ServiceDefinition definition;
    std::string reason;
    if (!veld::parseServiceDefinition(text, definition, reason)) {
        check(!reason.empty(), "a refusal has a reason");
        return 0;
    }
    check(!definition.name.empty(), "a service has a name");
    for (const veld::ServicePorts &side : {definition.source, definition.destination}) {
        for (const std::string &port : side.ports) {
            check(veld::isPortEntry(port), "only usable ports");
        }
    }
    check(veld::protocolKind(definition) ==
              (definition.destination.ports.empty() ? definition.source : definition.destination).protocol,
          "the protocol of the list that counts");
    return 0;
}
