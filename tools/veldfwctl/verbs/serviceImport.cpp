// SPDX-License-Identifier: Apache-2.0
// "service import": service definitions that another firewall manager has installed.
#include "verbs/serviceImport.h"

#include <algorithm>
#include <filesystem>
#include <memory>
#include <set>

#include "model/numbers.h"
#include "system/foreignServices.h"
#include "system/services.h"

namespace veldfwctl {

namespace {

struct Options {
    std::vector<std::string> names;
    std::vector<std::string> places;
    bool dryRun = false;
    bool replace = false;
};

std::vector<std::string> placesChosen(const Options &options) {
    if (!options.places.empty()) {
        return options.places;
    }
    std::vector<std::string> places;
    std::error_code error;
    std::copy_if(foreignServicePlaces().begin(), foreignServicePlaces().end(), std::back_inserter(places),
                 [&error](const std::string &place) { return std::filesystem::is_directory(place, error); });
    if (places.empty()) {
        throw Failure("No other firewall manager has services here; looked for " + join(foreignServicePlaces(), ", ") +
                      "; name another place with --from");
    }
    return places;
}

/// Keeps the services that were named, by either manager's name.
void namedKeep(std::vector<ServiceImport> &imports, const Options &options, const std::vector<std::string> &places) {
    if (options.names.empty()) {
        return;
    }
    const std::set<std::string> wanted(options.names.begin(), options.names.end());
    std::set<std::string> missing = wanted;
    std::vector<ServiceImport> kept;
    for (ServiceImport &import : imports) {
        const std::string name = serviceNameMake(import.name);
        if (wanted.count(import.name) > 0 || wanted.count(name) > 0) {
            missing.erase(import.name);
            missing.erase(name);
            kept.push_back(std::move(import));
        }
    }
    if (!missing.empty()) {
        throw UsageError("Service \"" + *missing.begin() + "\" is not in " + join(places, ", ") +
                         "; \"veldfwctl service import --dry-run\" lists what is");
    }
    imports = std::move(kept);
}

std::string stateText(ImportState state, bool dryRun) {
    switch (state) {
    case ImportState::NEW:
        return dryRun ? "would be new" : "imported";
    case ImportState::REPLACED:
        return dryRun ? "would be replaced" : "replaced";
    case ImportState::SAME:
        break;
    }
    return "already there";
}

/// How many services came to what.
struct Counts {
    int imported = 0;
    int definitions = 0;
    int present = 0;
    int hidden = 0;
    int refused = 0;
    int withLosses = 0;
};

Counts count(const std::vector<ServiceImport> &imports) {
    Counts counts;
    for (const ServiceImport &import : imports) {
        const auto isWritten = [](const ImportedDefinition &each) { return each.state != ImportState::SAME; };
        const auto written = std::count_if(import.definitions.begin(), import.definitions.end(), isWritten);
        if (!import.refusal.empty()) {
            ++counts.refused;
        } else if (!import.precedence.empty()) {
            ++counts.hidden;
        } else {
            ++(written > 0 ? counts.imported : counts.present);
            counts.definitions += static_cast<int>(written);
            counts.withLosses += import.losses.empty() ? 0 : 1;
        }
    }
    return counts;
}

void show(const Context &context, const std::vector<ServiceImport> &imports, const Counts &counts, bool dryRun) {
    Table table{{"FROM", "SERVICE", "PORTS", "STATE", "REMARK"}, {}};
    for (const ServiceImport &import : imports) {
        if (!import.refusal.empty()) {
            table.rows.push_back({import.name, "-", "-", {"refused", Shade::BAD}, import.refusal});
            continue;
        }
        if (!import.precedence.empty()) {
            table.rows.push_back({import.name,
                                  "-",
                                  "-",
                                  {"left out", Shade::FAINT},
                                  import.precedence + " comes before " + import.file});
            continue;
        }
        std::string remark = import.losses.empty() ? "-" : "lost: " + join(import.losses, "; ");
        for (const ImportedDefinition &each : import.definitions) {
            const Shade shade = each.state == ImportState::SAME ? Shade::FAINT : Shade::GOOD;
            table.rows.push_back({import.name,
                                  each.definition.name,
                                  definitionPortsText(each.definition),
                                  {stateText(each.state, dryRun), shade},
                                  remark});
            remark = "-";
        }
    }
    context.printTable(table);
    context.print(std::string(dryRun ? "Would import " : "Imported ") + std::to_string(counts.imported) +
                  " services as " + std::to_string(counts.definitions) + " definitions; " +
                  std::to_string(counts.present) + " were there already, " + std::to_string(counts.hidden) +
                  " left out, " + std::to_string(counts.refused) + " refused; " + std::to_string(counts.withLosses) +
                  " lost something.");
}

Json::Value textsJson(const std::vector<std::string> &texts) {
    Json::Value json = Json::arrayValue;
    for (const std::string &text : texts) {
        json.append(text);
    }
    return json;
}

Json::Value importJson(const ServiceImport &import) {
    Json::Value json;
    json["from"] = import.name;
    json["file"] = import.file;
    json["losses"] = textsJson(import.losses);
    json["definitions"] = Json::arrayValue;
    if (!import.refusal.empty()) {
        json["refused"] = import.refusal;
        return json;
    }
    if (!import.precedence.empty()) {
        json["preceded_by"] = import.precedence;
    }
    for (const ImportedDefinition &each : import.definitions) {
        Json::Value entry;
        entry["name"] = each.definition.name;
        entry["ports"] = definitionPortsText(each.definition);
        entry["state"] = each.state == ImportState::NEW    ? "new"
                         : each.state == ImportState::SAME ? "present"
                                                           : "replaced";
        json["definitions"].append(entry);
    }
    return json;
}

void showJson(const Context &context, const std::vector<ServiceImport> &imports, const Counts &counts, bool dryRun) {
    Json::Value json;
    json["dry_run"] = dryRun;
    json["imported"] = counts.imported;
    json["definitions"] = counts.definitions;
    json["present"] = counts.present;
    json["left_out"] = counts.hidden;
    json["refused"] = counts.refused;
    json["with_losses"] = counts.withLosses;
    json["services"] = Json::arrayValue;
    for (const ServiceImport &import : imports) {
        json["services"].append(importJson(import));
    }
    context.printJson(json);
}

void importWrite(const std::vector<ServiceImport> &imports) {
    std::vector<std::pair<ServiceDefinition, std::string>> definitions;
    for (const ServiceImport &import : imports) {
        for (const ImportedDefinition &each : import.definitions) {
            if (import.refusal.empty() && each.state != ImportState::SAME) {
                definitions.emplace_back(each.definition, std::filesystem::absolute(import.file));
            }
        }
    }
    definitionsWrite(definitions);
    // The registry has the last word on what counts.
    const ServiceRegistry registry;
    for (const auto &[definition, origin] : definitions) {
        const std::optional<Service> service = registry.find(definition.name);
        if (!service || !definitionOf(*service).matchesSame(definition)) {
            throw Failure("Service \"" + definition.name + "\" of " + origin +
                          " was written, but the service registry does not have it so; the system log says why");
        }
    }
}

void partsTell(const Context &context, const ServiceImport &import) {
    std::vector<std::string> parts;
    for (const ImportedDefinition &each : import.definitions) {
        parts.push_back(each.definition.name);
    }
    context.print("Rules name all parts of " + import.name + ": --service " + join(parts, ","));
}

int import(const Context &context, const Options &options) {
    const std::vector<std::string> places = placesChosen(options);
    const std::vector<ForeignService> services = foreignServicesRead(places);
    IncludedServices included(services);
    std::vector<ServiceImport> imports =
        servicesTranslate(services, [&included](const std::string &name, const ForeignService &includer) {
            return included.find(name, includer);
        });
    namedKeep(imports, options, places);
    std::stable_sort(imports.begin(), imports.end(),
                     [](const ServiceImport &a, const ServiceImport &b) { return a.name < b.name; });
    const ServiceRegistry registry;
    importCompare(
        imports,
        [&registry](const std::string &name) {
            const std::optional<Service> service = registry.find(name);
            return service ? std::optional<ServiceDefinition>(definitionOf(*service)) : std::nullopt;
        },
        options.replace);
    if (!options.dryRun) {
        importWrite(imports);
    }
    const Counts counts = count(imports);
    if (context.json) {
        showJson(context, imports, counts, options.dryRun);
    } else {
        show(context, imports, counts, options.dryRun);
    }
    for (const ServiceImport &import : imports) {
        if (!options.names.empty() && import.refusal.empty() && import.definitions.size() > 1) {
            partsTell(context, import);
        }
    }
    return counts.refused > 0 || counts.imported + counts.present == 0 ? STATUS_NO : STATUS_DONE;
}

}  // namespace

void serviceImportAdd(CLI::App &group, Context &context) {
    const auto options = std::make_shared<Options>();
    CLI::App *verb = verbAdd(
        group, context,
        {"import", "Take over services that another firewall manager has installed",
         "veldfwctl service import --dry-run\n"
         "veldfwctl service import samba nfs\n"
         "veldfwctl service import --from backup/etc/firewalld/services",
         [&context, options] { return import(context, *options); }, false,
         "Reads the service files of firewalld (XML) and the application profiles of ufw (INI), and writes a "
         "definition "
         "for each service\nthat is not there yet. A definition has ports of one protocol, or the same of tcp and udp. "
         "A "
         "service that needs\nmore becomes several, and a rule names them all: --service samba-tcp,samba-udp. What no "
         "definition can hold is\nlost, and the remark says so: other protocols, destination addresses, connection "
         "tracking helpers. Included services\nbecome part of those that include them. Titles and descriptions are "
         "left out.\n\nThe exit status is 1 when something was refused, or nothing could be imported."});
    verb->add_option("NAME", options->names, "Services to import, by the other manager's name (else all)");
    verb->add_option("--from", options->places, "File or directory to read in place of the standard ones; repeatable")
        ->check(CLI::ExistingPath)
        ->expected(1)
        ->multi_option_policy(CLI::MultiOptionPolicy::TakeAll);
    verb->add_flag("-n,--dry-run", options->dryRun, "Tell what would be done, and do nothing");
    verb->add_flag(
        "--replace", options->replace,
        "Replace definitions that have the same name and differ; one that a package brought comes back with its "
        "next version");
}

}  // namespace veldfwctl
