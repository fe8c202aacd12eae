#include "tools/Command.h"

#include <gtest/gtest.h>

using tool::Command;

namespace {

// How a command with a flag, an option and two arguments reads a command line.
class Reading {
public:
    explicit Reading(std::vector<std::string> strArguments)
        : m_command("try", "tries it", [] { return 0; }), m_strArguments(std::move(strArguments))
    {
        m_command.flag("-f,--flag", m_blFlag, "a flag");
        const auto keep = [](std::string& strKept) {
            return [&strKept](const std::string& strText) { strKept += "<" + strText + ">"; };
        };
        m_command.option("-o,--option", "TEXT", keep(m_strOption), "an option");
        const auto refuse = [](const std::string&) { throw tool::BadValue("refused"); };
        m_command.option("--refuse", "TEXT", refuse, "takes nothing");
        m_command.optionalArgument("FIRST", keep(m_strFirst), "the first");
        m_command.remainingArguments("MORE", keep(m_strMore), "all others");
    }

    // All that was read, or what is wrong with it.
    std::string text()
    {
        std::string strName = "try";
        std::vector<char*> rgArguments = {strName.data()};
        for (std::string& strArgument : m_strArguments) {
            rgArguments.push_back(strArgument.data());
        }
        const int nArguments = static_cast<int>(rgArguments.size());
        rgArguments.push_back(nullptr);
        try {
            m_command.read(nArguments, rgArguments.data());
            m_command.take();
        } catch (const tool::Failure& failure) {
            return failure.what();
        }
        return std::string(m_blFlag ? "flag " : "") + "option" + m_strOption + " first" + m_strFirst +
               " more" + m_strMore;
    }

private:
    Command m_command;
    std::vector<std::string> m_strArguments;
    bool m_blFlag = false;
    std::string m_strOption;
    std::string m_strFirst;
    std::string m_strMore;
};

} // namespace

// One after the other, which also shows that nothing of one gets into the next.
TEST(CommandLine, IsReadFromItsBeginning)
{
    const std::pair<std::vector<std::string>, std::string> CASES[] = {
        {{}, "option first more"},
        {{"-f", "-f", "--flag"}, "flag option first more"},
        {{"a", "-fo", "b", "c", "d"}, "flag option<b> first<a> more<c><d>"},
        {{"--option=", "-"}, "option<> first<-> more"},
        {{"--option", "--flag"}, "option<--flag> first more"},
        {{"-o", "", "", "--", "-f", "--"}, "option<> first<> more<-f><-->"},
        {{"-xf"}, "unknown option \"-x\""},
        {{"a"}, "option first<a> more"},
        {{"--option=1", "-o2"}, "--option: can be given once only"},
        {{"--option"}, "--option: needs a value"},
        {{"-o"}, "--option: needs a value"},
        {{"--flag=1"}, "--flag: takes no value"},
        {{"--flag="}, "--flag: takes no value"},
        {{"--fla"}, "unknown option \"--fla\"; did you mean \"--flag\"?"},
        {{"--x=1"}, "unknown option \"--x\""},
        {{"--="}, "unknown option \"--\""},
        {{"FIRST"}, "option first<FIRST> more"},
        {{"--refuse=1", "--x"}, "--refuse: refused"},
        {{"--x", "--refuse=1"}, "unknown option \"--x\""},
        {{"--refuse=1", "--refuse=2"}, "--refuse: refused"},
    };
    for (const auto& each : CASES) {
        EXPECT_EQ(each.second, Reading(each.first).text());
    }
}
