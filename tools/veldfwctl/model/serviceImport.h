// SPDX-License-Identifier: Apache-2.0
// Turns services of other firewall managers into definitions of the service registry.
#ifndef VELDFWCTL_SERVICEIMPORT_H
#define VELDFWCTL_SERVICEIMPORT_H

#include <functional>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "model/foreignService.h"

namespace veldfwctl {

/// What one definition file holds. Packets match by the source list or by the destination list.
struct ServiceDefinition {
    std::string name;
    int sourceProtocol = 0;  ///< a FW_PORT_PROTOCOL number
    NumberSet sourcePorts;
    int destinationProtocol = 0;
    NumberSet destinationPorts;

    /// Whether rules that name either match the same packets. Names do not count.
    bool matchesSame(const ServiceDefinition &other) const;
};

enum class ImportState {
    NEW,      ///< nothing has that name yet
    SAME,     ///< it is there already
    REPLACED  ///< takes the place of another definition
};

struct ImportedDefinition {
    ServiceDefinition definition;
    ImportState state = ImportState::NEW;
};

/// What becomes of one service.
struct ServiceImport {
    std::string name;  ///< as the other manager calls it
    std::string file;
    std::vector<ImportedDefinition> definitions;  ///< several when one record cannot hold it
    std::vector<std::string> losses;              ///< what no definition can hold
    std::string refusal;                          ///< why nothing of it is imported; empty otherwise
    std::string precedence;                       ///< the file that comes before this one and defines it, too; or empty
};

/// The service of that name which belongs to the same manager as the includer; null when there is none.
using IncludeFind = std::function<const ForeignService *(const std::string &name, const ForeignService &includer)>;

/// Translates services; of several with one name the first counts.
std::vector<ServiceImport> servicesTranslate(const std::vector<ForeignService> &services, const IncludeFind &find);

/// What the registry has under a name; empty for nothing.
using DefinitionFind = std::function<std::optional<ServiceDefinition>(const std::string &name)>;

/// Compares with what is there: sets states, and refusals for services that would replace something else.
/// @param mayReplace replace it instead
void importCompare(std::vector<ServiceImport> &imports, const DefinitionFind &existing, bool mayReplace);

/// A name for the registry and for a file: letters, digits and "._+-", at most 100 of them. Others become "-".
/// @return empty when nothing is left
std::string serviceNameMake(const std::string &foreignName);

/// "80" and "1000-2000", ascending.
std::vector<std::string> portTexts(const NumberSet &ports);
/// The set of such texts; entries that are none are left out.
NumberSet portSet(const std::vector<std::string> &texts);

/// "80,1000-2000/tcp, from 68/udp".
std::string definitionPortsText(const ServiceDefinition &definition);

/// The member of a definition file that tells from where it was imported.
inline constexpr const char *IMPORTED_FROM = "imported_from";

/// The content of a definition file.
/// @param origin the file that it was imported from; empty to leave that out
std::string definitionText(const ServiceDefinition &definition, const std::string &origin);

}  // namespace veldfwctl

#endif
