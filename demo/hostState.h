// SPDX-License-Identifier: Apache-2.0
// What the demonstration must leave as it was: the machine's rules, files and namespaces.
#ifndef VELD_DEMO_HOST_STATE_H
#define VELD_DEMO_HOST_STATE_H

#include <map>
#include <string>
#include <vector>

namespace demo {

/// One thing measured: its text, a line per item, and how many items it has.
struct Measurement {
    std::string text;
    size_t items = 0;
};

/// Measurements by title, of the machine outside of any sandbox. Reads only.
std::map<std::string, Measurement> measureHost();

/// Identities of the namespaces of this process ("net:[4026531840]", ...).
std::vector<std::string> ownNamespaces();

/// Processes of this machine that live in one of the namespaces, as far as this user may see.
std::vector<std::string> processesIn(const std::vector<std::string> &namespaces);

/// Prints a line per title and the lines that differ. @return number of titles that differ
int compareHost(const std::map<std::string, Measurement> &before, const std::map<std::string, Measurement> &after);

}  // namespace demo

#endif
