// SPDX-License-Identifier: Apache-2.0
// Runs the sessions in sessions/ and the commands of docs/administration.md: what a user types, and what must come
// back.
//
//   $ rule add --deny      a run of the tool; words may be in double quotes
//   ? command              a run of bash; "veldfwctl" is in its path
//   > text                 a line of standard output; all lines must be listed, "> ..." stands for any number of them
//   ! text                 part of a line of standard error; all lines must be listed
//   = 2                    exit status; 0 when not said
//   ~ PROFILE.ADAPTER {}   members that the last rule of that list has in the store; "none" for an empty list
//   + command              an iptables command that was run, in this order among others
//   % fail PART :: TEXT    from now on a command that holds PART fails, and prints TEXT
//   % delay MILLISECONDS   each command of the next run lasts that long
//   % kernel               from now on the machine's own iptables are run, on the sandbox's network
//   % need PROGRAM         skips the rest where the machine does not have it
//   % write PATH TEXT      writes a file; "\n" in the text stands for the end of a line
//   % remove PATH
#include <json/value.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <optional>
#include <regex>

#include "caseTable.h"
#include "commandRecorder.h"
#include "files.h"
#include "realIptables.h"
#include "toolFixture.h"

namespace veldtest {

namespace {

using Lines = std::vector<std::string>;

const std::regex HELD_UP(R"(New traffic was held up for at most [0-9]+\.[0-9] s\.)");

/// Words between blanks, or in double quotes.
Lines wordsOf(const std::string &line) {
    Lines words;
    const Lines parts = split(line, '"');
    for (size_t i = 0; i < parts.size(); ++i) {
        const Lines found = i % 2 == 1 ? Lines{parts[i]} : split(parts[i], ' ');
        std::copy_if(found.begin(), found.end(), std::back_inserter(words),
                     [i](const std::string &word) { return i % 2 == 1 || !word.empty(); });
    }
    return words;
}

/// Whether the lines are the expected ones, where "..." stands for any number of lines.
bool linesMatch(const Lines &lines, const Lines &expected, size_t line = 0, size_t at = 0) {
    if (at == expected.size()) {
        return line == lines.size();
    }
    if (expected[at] == "...") {
        return linesMatch(lines, expected, line, at + 1) ||
               (line < lines.size() && linesMatch(lines, expected, line + 1, at));
    }
    return line < lines.size() && lines[line] == expected[at] && linesMatch(lines, expected, line + 1, at + 1);
}

ProgramResult runBash(const std::string &command) {
    const std::string directory = std::filesystem::path(VELDFWCTL).parent_path();
    return runProgram({"bash", "-c", "PATH=" + directory + ":$PATH; " + command});
}

/// Why a session cannot go on here.
struct Unavailable {
    std::string reason;
};

class Session {
public:
    explicit Session(std::string file) : m_file(std::move(file)) {}

    void play() {
        std::ifstream stream(m_file);
        ASSERT_TRUE(stream) << m_file;
        size_t number = 0;
        for (std::string line; std::getline(stream, line);) {
            ++number;
            const char kind = line.empty() ? '#' : line[0];
            const std::string text = line.size() > 2 ? line.substr(2) : "";
            if (kind == '=') {
                m_status = std::stoi(text);
            } else if (std::string(">!+").find(kind) != std::string::npos) {
                m_expected[kind].push_back(text);
            } else if (kind != '#') {
                finish();
                m_place = m_file + ":" + std::to_string(number) + ": " + text;
                SCOPED_TRACE(m_place);
                begin(kind, text);
            }
        }
        finish();
    }

private:
    void begin(char kind, const std::string &text) {
        switch (kind) {
        case '$':
        case '?':
            m_command = kind + text;
            break;
        case '~':
            storeCheck(text);
            break;
        case '%':
            direct(text);
            break;
        default:
            FAIL() << "not a line of a session";
        }
    }

    void finish() {
        if (m_command.empty()) {
            return;
        }
        SCOPED_TRACE(m_place);
        const std::string command = m_command.substr(1);
        const ProgramResult result = m_command[0] == '$' ? runTool(wordsOf(command)) : runBash(command);
        EXPECT_EQ(m_status, result.status) << result.output << result.errors;
        Lines lines = split(result.output, '\n');
        // How long an apply took differs from run to run.
        lines.erase(std::remove_if(lines.begin(), lines.end(),
                                   [](const std::string &line) { return std::regex_match(line, HELD_UP); }),
                    lines.end());
        EXPECT_TRUE(linesMatch(lines, m_expected['>'])) << result.output;
        const Lines errors = split(result.errors, '\n');
        EXPECT_EQ(m_expected['!'].size(), errors.size()) << result.errors;
        for (size_t i = 0; i < std::min(errors.size(), m_expected['!'].size()); ++i) {
            EXPECT_NE(errors[i].find(m_expected['!'][i]), std::string::npos) << result.errors;
        }
        if (m_recorder) {
            const Lines ran = m_recorder->lines();
            auto from = ran.begin();
            for (const std::string &expected : m_expected['+']) {
                from = std::find(from, ran.end(), expected);
                EXPECT_NE(from, ran.end()) << expected << testing::PrintToString(ran);
            }
            m_recorder->clear();
            for (const auto &[part, text] : m_failures) {
                m_recorder->failMatching(part, 2, text);
            }
        }
        m_command.clear();
        m_expected.clear();
        m_status = 0;
    }

    static void storeCheck(const std::string &text) {
        const size_t dot = text.find('.');
        const size_t blank = text.find(' ');
        const Json::Value list = storedProfile(text.substr(0, dot))["rules"][text.substr(dot + 1, blank - dot - 1)];
        const bool isNone = text.substr(blank + 1) == "none";
        ASSERT_EQ(isNone, list.empty()) << list.toStyledString();
        const Json::Value expected = isNone ? Json::Value() : parseJson(text.substr(blank + 1));
        for (const std::string &member : expected.getMemberNames()) {
            EXPECT_EQ(expected[member], list[list.size() - 1][member]) << member;
        }
    }

    void direct(const std::string &text) {
        const std::string verb = text.substr(0, text.find(' '));
        const std::string rest = text.substr(std::min(text.size(), verb.size() + 1));
        if (verb == "fail") {
            const size_t middle = rest.find(" :: ");
            m_failures.emplace_back(rest.substr(0, middle), rest.substr(middle + 4));
            m_recorder->failMatching(m_failures.back().first, 2, m_failures.back().second);
        } else if (verb == "write") {
            const std::string body = rest.substr(rest.find(' ') + 1);
            writeFile(rest.substr(0, rest.find(' ')), std::regex_replace(body, std::regex(R"(\\n)"), "\n"));
        } else if (verb == "delay") {
            m_recorder->setDelay(static_cast<unsigned>(std::stoul(rest)));
        } else if (verb == "remove") {
            removeAll(rest);
        } else if (verb == "kernel") {
            m_recorder.reset();
            std::string reason;
            if (!realIptables(&reason)) {
                throw Unavailable{reason};
            }
        } else if (verb == "need") {
            if (!runBash("command -v " + rest).succeeded()) {
                throw Unavailable{"no " + rest};
            }
        } else {
            FAIL() << "no direction of a session";
        }
    }

    const std::string m_file;
    std::string m_place;
    std::optional<CommandRecorder> m_recorder{std::in_place};
    std::vector<std::pair<std::string, std::string>> m_failures;
    std::string m_command;
    int m_status = 0;
    std::map<char, Lines> m_expected;
};

class SessionTest : public ToolTest, public testing::WithParamInterface<std::string> {};

TEST_P(SessionTest, GoesAsWritten) {
    try {
        Session(std::string(VELD_SESSIONS) + "/" + GetParam() + ".session").play();
    } catch (const Unavailable &unavailable) {
        GTEST_SKIP() << unavailable.reason;
    }
}

Lines sessionNames() {
    Lines names;
    for (const auto &entry : std::filesystem::directory_iterator(VELD_SESSIONS)) {
        names.push_back(entry.path().stem());
    }
    std::sort(names.begin(), names.end());
    return names;
}

INSTANTIATE_TEST_SUITE_P(Sessions, SessionTest, testing::ValuesIn(sessionNames()),
                         [](const auto &session) { return session.param; });

TEST_F(ToolTest, EveryCommandOfTheAdministratorsGuideWorks) {
    std::string reason;
    if (!realIptables(&reason)) {
        GTEST_SKIP() << reason;
    }
    removeAll("/usr/veld/etc/firewall.d");
    writeFile("/usr/veld/etc.defaults/firewall.d/1.json", readFile(VELD_DATA_DIR "/firewall.d/1.json"));
    makeDirectories("/root");
    // What another firewall manager would have installed, and nothing else of that kind.
    for (const char *directory : {"/etc/firewalld", "/usr/lib/firewalld", "/etc/ufw"}) {
        removeAll(directory);
    }
    writeFile("/usr/lib/firewalld/services/samba.xml", R"(<service><port port="137-138" protocol="udp"/>
        <port port="139" protocol="tcp"/><port port="445" protocol="tcp"/><helper name="netbios-ns"/></service>)");
    int commands = 0;
    bool isInBlock = false;
    for (const std::string &line : split(readFile(VELD_DATA_DIR "/../docs/administration.md"), '\n')) {
        if (line.rfind("```", 0) == 0) {
            isInBlock = line == "```sh";
        } else if (isInBlock) {
            const ProgramResult result = runBash(line);
            EXPECT_EQ(0, result.status) << line << "\n" << result.output << result.errors;
            ++commands;
        }
    }
    EXPECT_GE(commands, 15);
    EXPECT_EQ("office", parseJson(runTool({"status", "--json"}).output)["profile"].asString());
}

}  // namespace

}  // namespace veldtest
