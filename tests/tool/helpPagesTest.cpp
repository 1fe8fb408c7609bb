// SPDX-License-Identifier: Apache-2.0
// The manual page and the completions that are made from the texts of --help.
#include <gmock/gmock.h>

#include "files.h"
#include "toolFixture.h"

namespace veldtest {

namespace {

using testing::HasSubstr;
using testing::Not;

/// What bash offers after these words.
std::string offered(const std::string &words, int position) {
    return runChecked({"bash", "-c",
                       "source /tmp/completion; COMP_WORDS=(" + words + "); COMP_CWORD=" + std::to_string(position) +
                           "; _veldfwctl; echo \"${COMPREPLY[*]}\""});
}

TEST(HelpPagesTest, CompletionFollowsTheVerbsAndTheirOptions) {
    writeFile("/tmp/completion", runTool({"generate", "bash"}).output);
    EXPECT_EQ("rule\n", offered("veldfwctl ru", 1));
    EXPECT_THAT(offered("veldfwctl ''", 1), Not(HasSubstr("generate")));
    EXPECT_THAT(offered("veldfwctl rule ''", 2), HasSubstr("add remove"));
    EXPECT_EQ("--timeout\n", offered("veldfwctl try office --t", 3));
    EXPECT_THAT(runTool({"generate", "zsh"}).output, HasSubstr("'--timeout:Seconds until it is taken back'"));
}

TEST(HelpPagesTest, TheManualHasEveryVerbAndNoMistakeInItsForm) {
    const std::string page = runTool({"generate", "man"}).output;
    for (const std::string verb :
         {"setup", "rule add", "try profile", "backup export", "country ranges", "service import"}) {
        EXPECT_THAT(page, HasSubstr("\n.SS \"veldfwctl " + verb));
    }
    EXPECT_THAT(page, Not(HasSubstr("generate")));
    writeFile("/tmp/page", page);
    if (!pathExists("/usr/bin/groff")) {
        GTEST_SKIP() << "no groff";
    }
    EXPECT_EQ("", runProgram({"groff", "-man", "-Tutf8", "-ww", "-z", "/tmp/page"}).errors);
}

}  // namespace

}  // namespace veldtest
