// SPDX-License-Identifier: Apache-2.0
// Runs the sessions in sessions/: what a user types, and what must come back.
//
//   $ rule add --deny      a run of the tool; words may be in double quotes
//   > text                 a line of standard output; all lines must be listed, "> ..." stands for any number of them
//   ! text                 part of a line of standard error; all lines must be listed
//   = 2                    exit status; 0 when not said
//   ~ PROFILE.ADAPTER {}   members that the last rule of that list has in the store; "none" for an empty list
//   + command              an iptables command that was run, in this order among others
//   % fail PART :: TEXT    from now on a command that holds PART fails, and prints TEXT
//   % write PATH TEXT      writes a file; "\n" in the text stands for the end of a line
//   % remove PATH
#include <json/value.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <regex>
#include <sstream>

#include "commandRecorder.h"
#include "files.h"
#include "toolFixture.h"

namespace veldtest {

namespace {

constexpr const char *HELD_UP = "New traffic was held up for at most ";

std::vector<std::string> wordsOf(const std::string &line) {
    std::vector<std::string> words;
    std::string word;
    bool quoted = false;
    bool hasWord = false;
    for (const char c : line + " ") {
        if (c == '"') {
            quoted = !quoted;
            hasWord = true;
        } else if (c == ' ' && !quoted) {
            if (hasWord) {
                words.push_back(word);
            }
            word.clear();
            hasWord = false;
        } else {
            word += c;
            hasWord = true;
        }
    }
    return words;
}

std::vector<std::string> linesOf(const std::string &text) {
    std::istringstream stream(text);
    std::vector<std::string> lines;
    for (std::string line; std::getline(stream, line);) {
        lines.push_back(line);
    }
    return lines;
}

/// Whether the lines are the expected ones, where "..." stands for any number of lines.
bool linesMatch(const std::vector<std::string> &lines, const std::vector<std::string> &expected, size_t line = 0,
                size_t at = 0) {
    if (at == expected.size()) {
        return line == lines.size();
    }
    if (expected[at] == "...") {
        return linesMatch(lines, expected, line, at + 1) ||
               (line < lines.size() && linesMatch(lines, expected, line + 1, at));
    }
    return line < lines.size() && lines[line] == expected[at] && linesMatch(lines, expected, line + 1, at + 1);
}

/// One run of the tool with what the session expects of it.
struct Run {
    size_t lineNumber = 0;
    std::string command;
    std::vector<std::string> output;
    std::vector<std::string> errors;
    std::vector<std::string> commands;
    int status = 0;
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
            const std::string text = line.size() > 2 ? line.substr(2) : "";
            switch (line.empty() ? '#' : line[0]) {
            case '#':
                break;
            case '>':
                m_run.output.push_back(text);
                break;
            case '!':
                m_run.errors.push_back(text);
                break;
            case '=':
                m_run.status = std::stoi(text);
                break;
            case '+':
                m_run.commands.push_back(text);
                break;
            case '$':
                finish();
                m_run = {};
                m_run.lineNumber = number;
                m_run.command = text;
                break;
            case '~':
                finish();
                storeCheck(text, number);
                break;
            case '%':
                finish();
                direct(text, number);
                break;
            default:
                FAIL() << m_file << ":" << number << ": " << line;
            }
        }
        finish();
    }

private:
    void finish() {
        if (m_run.command.empty()) {
            return;
        }
        SCOPED_TRACE(m_file + ":" + std::to_string(m_run.lineNumber) + ": " + m_run.command);
        const ProgramResult result = runTool(wordsOf(m_run.command));
        EXPECT_EQ(m_run.status, result.status) << result.output << result.errors;
        std::vector<std::string> lines = linesOf(result.output);
        // How long an apply took differs from run to run.
        lines.erase(std::remove_if(lines.begin(), lines.end(),
                                   [](const std::string &line) { return line.rfind(HELD_UP, 0) == 0; }),
                    lines.end());
        EXPECT_TRUE(linesMatch(lines, m_run.output)) << result.output;
        const std::vector<std::string> errors = linesOf(result.errors);
        EXPECT_EQ(m_run.errors.size(), errors.size()) << result.errors;
        for (size_t i = 0; i < std::min(errors.size(), m_run.errors.size()); ++i) {
            EXPECT_NE(errors[i].find(m_run.errors[i]), std::string::npos) << result.errors;
        }
        const std::vector<std::string> ran = m_recorder.lines();
        auto from = ran.begin();
        for (const std::string &command : m_run.commands) {
            from = std::find(from, ran.end(), command);
            EXPECT_NE(from, ran.end()) << command << testing::PrintToString(ran);
        }
        m_recorder.clear();
        for (const auto &[part, text] : m_failures) {
            m_recorder.failMatching(part, 2, text);
        }
        m_run.command.clear();
    }

    void storeCheck(const std::string &text, size_t number) {
        SCOPED_TRACE(m_file + ":" + std::to_string(number));
        const size_t dot = text.find('.');
        const size_t blank = text.find(' ');
        const Json::Value profile = storedProfile(text.substr(0, dot));
        const Json::Value list = profile["rules"][text.substr(dot + 1, blank - dot - 1)];
        if (text.substr(blank + 1) == "none") {
            EXPECT_TRUE(list.empty()) << list.toStyledString();
            return;
        }
        ASSERT_FALSE(list.empty()) << profile.toStyledString();
        const Json::Value &rule = list[list.size() - 1];
        const Json::Value expected = parseJson(text.substr(blank + 1));
        for (const std::string &member : expected.getMemberNames()) {
            EXPECT_EQ(expected[member].toStyledString(), rule[member].toStyledString()) << member;
        }
    }

    void direct(const std::string &text, size_t number) {
        std::istringstream words(text);
        std::string verb;
        std::string object;
        words >> verb >> object;
        const std::string rest = text.substr(std::min(text.size(), verb.size() + object.size() + 2));
        if (verb == "fail") {
            const size_t split = text.find(" :: ");
            m_failures.emplace_back(text.substr(5, split - 5), text.substr(split + 4));
            m_recorder.failMatching(m_failures.back().first, 2, m_failures.back().second);
        } else if (verb == "write") {
            writeFile(object, std::regex_replace(rest, std::regex(R"(\\n)"), "\n"));
        } else if (verb == "remove") {
            removeAll(object);
        } else {
            FAIL() << m_file << ":" << number << ": " << text;
        }
    }

    std::string m_file;
    CommandRecorder m_recorder;
    std::vector<std::pair<std::string, std::string>> m_failures;
    Run m_run;
};

class SessionTest : public ToolTest, public testing::WithParamInterface<std::string> {};

std::vector<std::string> sessionNames() {
    std::vector<std::string> names;
    for (const auto &entry : std::filesystem::directory_iterator(VELD_SESSIONS)) {
        names.push_back(entry.path().stem());
    }
    std::sort(names.begin(), names.end());
    return names;
}

TEST_P(SessionTest, GoesAsWritten) {
    Session(std::string(VELD_SESSIONS) + "/" + GetParam() + ".session").play();
}

INSTANTIATE_TEST_SUITE_P(Sessions, SessionTest, testing::ValuesIn(sessionNames()),
                         [](const auto &session) { return session.param; });

}  // namespace

}  // namespace veldtest
