// SPDX-License-Identifier: Apache-2.0
// The manual page and the completions of shells, from the texts of --help.
#include "model/helpPages.h"

#include <functional>
#include <sstream>

namespace veldfwctl {

namespace {

/// What a command line can go on with after some verbs.
struct Word {
    std::string text;
    std::string meaning;
};

using Visit = std::function<void(const std::string &path, const CLI::App &app)>;

/// Visits the shown verbs in the order of the help text; paths are "veldfwctl rule add".
void walk(const CLI::App &app, const std::string &path, const Visit &visit) {
    visit(path, app);
    for (const CLI::App *verb : app.get_subcommands([](const CLI::App *each) { return !each->get_group().empty(); })) {
        walk(*verb, path + " " + verb->get_name(), visit);
    }
}

std::vector<Word> nextWords(const CLI::App &app) {
    std::vector<Word> words;
    for (const CLI::App *verb : app.get_subcommands([](const CLI::App *each) { return !each->get_group().empty(); })) {
        words.push_back({verb->get_name(), verb->get_description()});
    }
    for (const CLI::Option *option : app.get_options()) {
        if (!option->get_lnames().empty() && !option->get_group().empty()) {
            words.push_back({"--" + option->get_lnames().front(), option->get_description()});
        }
    }
    return words;
}

std::string roff(const std::string &text) {
    std::string result;
    std::istringstream lines(text);
    for (std::string line; std::getline(lines, line);) {
        result += line.rfind('.', 0) == 0 || line.rfind('\'', 0) == 0 ? "\\&" : "";
        for (const char c : line) {
            result += c == '\\' ? "\\e" : c == '-' ? "\\-" : std::string(1, c);
        }
        result += "\n";
    }
    return result;
}

/// Footers are paragraphs; lines that begin with a blank are commands.
std::string roffFooter(const std::string &footer) {
    std::string result;
    std::istringstream lines(footer);
    for (std::string line; std::getline(lines, line);) {
        if (line.empty()) {
            result += ".PP\n";
        } else if (line.front() == ' ') {
            result += ".RS\n.nf\n" + roff(line.substr(line.find_first_not_of(' '))) + ".fi\n.RE\n";
        } else {
            result += roff(line);
        }
    }
    return result;
}

/// In single quotes, as every shell reads it.
std::string shellWord(const std::string &text) {
    std::string result = "'";
    for (const char c : text) {
        result += c == '\'' ? "'\\''" : std::string(1, c);
    }
    return result + "'";
}

}  // namespace

std::string manualPage(const CLI::App &app, const std::string &version) {
    std::string page = ".TH VELDFWCTL 8 \"\" \"veldfwctl " + version + "\" \"System administration\"\n.SH NAME\n" +
                       "veldfwctl \\- " + roff(app.get_description()) +
                       ".SH SYNOPSIS\n.B veldfwctl\n.I VERB\n[\\fIOPTIONS\\fR]\n.SH VERBS\n";
    walk(app, "veldfwctl", [&](const std::string &path, const CLI::App &verb) {
        if (verb.get_parent() == nullptr) {
            return;
        }
        page += ".SS \"" + path;
        for (const CLI::Option *option : verb.get_options()) {
            page += option->get_positional() ? " " + option->get_name(true) : "";
        }
        page += "\"\n" + roff(verb.get_description() + ".");
        for (const CLI::Option *option : verb.get_options()) {
            const std::string preset = option->get_default_str().empty() ? "" : " [" + option->get_default_str() + "]";
            page += ".TP\n.B " + roff(option->get_name(option->get_positional(), true)) +
                    roff(option->get_description() + preset);
        }
        page += verb.get_footer().empty() ? "" : ".PP\n" + roffFooter(verb.get_footer());
    });
    return page + ".SH EXIT STATUS\n" + roffFooter(app.get_footer());
}

std::string bashCompletion(const CLI::App &app) {
    std::string cases;
    walk(app, "veldfwctl", [&cases](const std::string &path, const CLI::App &verb) {
        std::string words;
        for (const Word &word : nextWords(verb)) {
            words += (words.empty() ? "" : " ") + word.text;
        }
        cases += "    " + shellWord(path) + ") words=" + shellWord(words) + " ;;\n";
    });
    return "# bash completion for veldfwctl\n"
           "_veldfwctl_words() {\n"
           "  case \"$1\" in\n" +
           cases +
           "    *) return 1 ;;\n"
           "  esac\n"
           "}\n"
           "_veldfwctl() {\n"
           "  local current=\"${COMP_WORDS[COMP_CWORD]}\" path=veldfwctl words i\n"
           "  for ((i = 1; i < COMP_CWORD; i++)); do\n"
           "    _veldfwctl_words \"$path ${COMP_WORDS[i]}\" && path+=\" ${COMP_WORDS[i]}\"\n"
           "  done\n"
           "  _veldfwctl_words \"$path\"\n"
           "  mapfile -t COMPREPLY < <(compgen -W \"$words\" -- \"$current\")\n"
           "}\n"
           "complete -o default -F _veldfwctl veldfwctl\n";
}

std::string zshCompletion(const CLI::App &app) {
    std::string cases;
    walk(app, "veldfwctl", [&cases](const std::string &path, const CLI::App &verb) {
        cases += "    " + shellWord(path) + ") entries=(";
        for (const Word &word : nextWords(verb)) {
            cases += " " + shellWord(word.text + ":" + word.meaning);
        }
        cases += " ) ;;\n";
    });
    return "#compdef veldfwctl\n"
           "_veldfwctl_entries() {\n"
           "  case \"$1\" in\n" +
           cases +
           "    *) return 1 ;;\n"
           "  esac\n"
           "}\n"
           "_veldfwctl() {\n"
           "  local -a entries\n"
           "  local path_of_verbs=veldfwctl word\n"
           "  for word in \"${(@)words[2,CURRENT-1]}\"; do\n"
           "    _veldfwctl_entries \"$path_of_verbs $word\" && path_of_verbs+=\" $word\"\n"
           "  done\n"
           "  _veldfwctl_entries \"$path_of_verbs\"\n"
           "  _describe veldfwctl entries || _files\n"
           "}\n"
           "_veldfwctl \"$@\"\n";
}

}  // namespace veldfwctl
