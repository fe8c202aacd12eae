#include "tools/Console.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <pty.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <iostream>

#include "ScarceMemory.h"
#include "tools/LogLines.h"

namespace {

// A terminal that a stream goes to until the test's process ends.
class Terminal {
public:
    explicit Terminal(int nStream)
    {
        int nSlave = -1;
        openpty(&m_nMaster, &nSlave, nullptr, nullptr, nullptr);
        dup2(nSlave, nStream);
        close(nSlave);
    }

    // What it shows of what was written, which must not be nothing.
    std::string shown() const
    {
        fflush(nullptr);
        char szShown[1000];
        const ssize_t cbShown = read(m_nMaster, szShown, sizeof(szShown));
        return std::string(szShown, static_cast<size_t>(cbShown));
    }

private:
    int m_nMaster = -1;
};

const std::string ID(127, 'x');

} // namespace

TEST(Streams, AreAllOpenAndNoOtherDescriptorsAre)
{
    tool::completeStreams();
    const int nFree = dup(STDOUT_FILENO);
    close(nFree);
    close(STDIN_FILENO);
    tool::completeStreams();
    EXPECT_EQ("/dev/null", std::filesystem::read_symlink("/proc/self/fd/0"));
    EXPECT_EQ(O_RDONLY, fcntl(STDIN_FILENO, F_GETFL) & O_ACCMODE);
    EXPECT_EQ(FD_CLOEXEC, fcntl(STDIN_FILENO, F_GETFD));
    EXPECT_EQ(nFree, dup(STDOUT_FILENO));
}

TEST(Streams, KeepTheReasonOfAFailure)
{
    errno = ENOSPC;
    EXPECT_FALSE(tool::isTerminal(tmpfile()));
    EXPECT_EQ(ENOSPC, errno);
}

TEST(Secrets, AreWholeLinesOrNoneWhenMemoryFails)
{
    FILE* const pFile = tmpfile();
    dup2(fileno(pFile), STDIN_FILENO);
    fprintf(pFile, "%s\n%s", ID.c_str(), ID.c_str());
    fflush(pFile);
    tool::completeStreams();
    const auto results = resultsWhileMemoryFails([] {
        std::cin.clear(); // of the failure before
        fseek(stdin, 0, SEEK_SET);
        return tool::readSecrets("");
    });
    EXPECT_EQ((std::set<std::vector<std::string>>{{ID, ID}}), results);
}

TEST(Result, OfAsciiAloneTakesNoMemoryOnATerminal)
{
    const Terminal terminal(STDOUT_FILENO);
    g_pAllocation = [] { throw std::bad_alloc(); };
    tool::print(ID);
    g_pAllocation = nullptr;
    EXPECT_EQ(ID, terminal.shown());
    tool::print("\xff");
    EXPECT_EQ("\\udcff", terminal.shown());
}

TEST(LogLines, AreEscapedForATerminalAlone)
{
    dup2(fileno(tmpfile()), STDERR_FILENO);
    EXPECT_EQ("\u00e4\x1b", tool::errorLine("\u00e4\x1b"));
    const Terminal terminal(STDERR_FILENO);
    EXPECT_EQ("\\xc3\\xa4\\x1b", tool::errorLine("\u00e4\x1b"));
}

// Also if stdout is not the one that the program began with.
TEST(LogLines, GiveStdoutBack)
{
    FILE* const pBefore = stdout;
    FILE* const pOther = tmpfile();
    stdout = pOther;
    {
        const tool::LogLines logLines(false);
        EXPECT_NE(pOther, stdout);
    }
    FILE* const pAfter = stdout;
    stdout = pBefore;
    EXPECT_EQ(pOther, pAfter);
}
