// SPDX-License-Identifier: Apache-2.0
// Application profiles in INI files. Boost.PropertyTree's reader does not do: it gives up a whole file for one bad
// line, forgets line numbers, and knows neither values that go on in an indented line nor "key: value".
#include <algorithm>
#include <cctype>
#include <set>
#include <sstream>

#include "model/foreignService.h"
#include "model/numbers.h"

namespace veldfwctl {

namespace {

constexpr const char *BLANKS = " \t\r\n\f\v";

std::string trim(const std::string &text) {
    const size_t first = text.find_first_not_of(BLANKS);
    return first == std::string::npos ? "" : text.substr(first, text.find_last_not_of(BLANKS) - first + 1);
}

std::string portEntryAdd(ForeignService &service, const std::string &entry) {
    const std::vector<std::string> halves = split(entry, '/');
    const std::vector<std::string> ports = split(halves.front(), ',');
    const std::string protocol = halves.size() == 1 ? "any" : trim(halves[1]);
    if (halves.size() > 2) {
        return "\"" + entry + "\" has more than one protocol";
    }
    if (halves.size() == 1 && (ports.size() > 1 || entry.find(':') != std::string::npos)) {
        return "\"" + entry + "\" has several ports and no protocol";
    }
    for (const std::string &port : ports) {
        if (std::string problem = foreignPortsAdd(service, service.destination, trim(port), ':', protocol);
            !problem.empty()) {
            return problem;
        }
    }
    return "";
}

class Reader {
public:
    explicit Reader(std::string file) : m_file(std::move(file)) {}

    std::vector<ForeignService> read(const std::string &text) {
        std::istringstream lines(text.rfind("\xEF\xBB\xBF", 0) == 0 ? text.substr(3) : text);
        for (std::string line; std::getline(lines, line);) {
            ++m_line;
            const std::string content = trim(line);
            if (content.empty() || content[0] == '#' || content[0] == ';') {
                continue;
            }
            if (m_goesOn && std::isspace(static_cast<unsigned char>(line[0])) != 0) {
                m_ports += m_keyIsPorts ? content : "";
            } else if (content[0] == '[') {
                sectionEnd();
                sectionBegin(content);
            } else {
                keyRead(content);
            }
        }
        sectionEnd();
        return std::move(m_services);
    }

private:
    void sectionBegin(const std::string &content) {
        const size_t end = content.rfind(']');
        m_services.emplace_back();
        m_services.back().file = m_file;
        m_services.back().name = trim(content.substr(1, end == std::string::npos ? end : end - 1));
        m_sectionLine = m_line;
        if (end == std::string::npos) {
            fault(m_line, "\"[\" without \"]\"");
        } else if (!m_names.insert(m_services.back().name).second) {
            fault(m_line, "profile \"" + m_services.back().name + "\" is there twice");
        }
    }

    void keyRead(const std::string &content) {
        m_goesOn = false;
        const size_t sign = content.find_first_of("=:");
        if (m_services.empty()) {
            m_services.emplace_back();
            m_services.back().file = m_file;
            fault(m_line, "neither XML nor a profile \"[Name]\"");
            return;
        }
        if (sign == std::string::npos || sign == 0) {
            fault(m_line, "\"" + content + "\" is not \"key=value\"");
            return;
        }
        std::string key = trim(content.substr(0, sign));
        std::transform(key.begin(), key.end(), key.begin(),
                       [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
        m_goesOn = true;
        m_keyIsPorts = key == "ports";
        if (m_keyIsPorts) {
            if (m_portsLine != 0) {
                fault(m_line, "\"ports\" is there twice");
            }
            m_portsLine = m_line;
            m_ports = trim(content.substr(sign + 1));
        } else if (key != "title" && key != "description") {
            m_services.back().losses.push_back("\"" + key + "\", which is not known");
        }
    }

    void sectionEnd() {
        if (!m_services.empty() && m_services.back().error.empty()) {
            if (m_ports.empty()) {
                fault(m_portsLine == 0 ? m_sectionLine : m_portsLine,
                      "profile \"" + m_services.back().name + "\" has no ports");
            }
            for (const std::string &entry : m_ports.empty() ? std::vector<std::string>() : split(m_ports, '|')) {
                if (const std::string problem = portEntryAdd(m_services.back(), trim(entry)); !problem.empty()) {
                    fault(m_portsLine, problem);
                }
            }
        }
        m_ports.clear();
        m_portsLine = 0;
        m_goesOn = false;
    }

    /// The first fault of a profile counts.
    void fault(int line, const std::string &what) {
        if (m_services.back().error.empty()) {
            m_services.back().error = m_file + ":" + std::to_string(line) + ": " + what;
        }
    }

    std::string m_file;
    int m_line = 0;
    std::vector<ForeignService> m_services;
    std::set<std::string> m_names;
    int m_sectionLine = 0;
    std::string m_ports;
    int m_portsLine = 0;        ///< 0: this profile has none so far
    bool m_goesOn = false;      ///< an indented line belongs to the value before it
    bool m_keyIsPorts = false;  ///< and that value are the ports
};

}  // namespace

std::vector<ForeignService> applicationProfilesParse(const std::string &file, const std::string &text) {
    return Reader(file).read(text);
}

}  // namespace veldfwctl
