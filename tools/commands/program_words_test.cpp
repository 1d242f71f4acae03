#include "tools/commands/program_words.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using Words = std::vector<std::string>;

void expectSplit(const Words& words, const Words& own, const Words& program)
{
    const auto split = splitCommandLine(words);
    EXPECT_EQ(split.own, own);
    EXPECT_EQ(split.program, program);
}

TEST(ProgramWords, BeginBehindTheOptionsOfRun)
{
    expectSplit({"--root", "R", "run", "--bind", "a", "b", "app", "--help", "[1,2]"},
                {"--root", "R", "run", "--bind", "a", "b"}, {"app", "--help", "[1,2]"});
    expectSplit({"run", "--bind=a", "b", "app"}, {"run", "--bind=a", "b"}, {"app"});
}

TEST(ProgramWords, BeginBehindADoubleDash)
{
    expectSplit({"run", "--", "app", "--", "x"}, {"run"}, {"app", "--", "x"});
    expectSplit({"run", "--", "--odd-name"}, {"run"}, {"--odd-name"});
    expectSplit({"run", "--"}, {"run"}, {});
}

TEST(ProgramWords, AreNoneForOtherCommands)
{
    expectSplit({"open", "run"}, {"open", "run"}, {});
    expectSplit({"--root", "run", "checkin"}, {"--root", "run", "checkin"}, {});
    expectSplit({}, {}, {});
    expectSplit({"--root"}, {"--root"}, {});
}

TEST(ProgramWords, AreLeftInPlaceBehindAnUnknownOption)
{
    expectSplit({"run", "--bnid", "app"}, {"run", "--bnid", "app"}, {});
}

TEST(ProgramWords, AreNoneWhenOnlyHelpIsAskedFor)
{
    expectSplit({"run", "--help"}, {"run", "--help"}, {});
    expectSplit({"run", "--bind", "a"}, {"run", "--bind", "a"}, {});
}

}  // namespace
}  // namespace typhon
