#include "tools/Console.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <pty.h>
#include <unistd.h>

#include <cerrno>
#include <clocale>
#include <cstring>
#include <filesystem>
#include <iostream>

#include "ScarceMemory.h"
#include "tools/LogLines.h"

namespace {

// A terminal that a stream goes to from here on.
class Terminal {
public:
    explicit Terminal(FILE* pStream)
    {
        openpty(&m_nMaster, &m_nSlave, nullptr, nullptr, nullptr);
        dup2(m_nSlave, fileno(pStream));
    }
    ~Terminal()
    {
        close(m_nMaster);
        close(m_nSlave);
    }
    Terminal(const Terminal&) = delete;
    Terminal& operator=(const Terminal&) = delete;

    // What it shows of what a function writes, which is not nothing.
    template <typename Write>
    std::string shown(Write write) const
    {
        write();
        fflush(nullptr);
        char szShown[1000];
        const ssize_t cbShown = read(m_nMaster, szShown, sizeof(szShown));
        return std::string(szShown, static_cast<size_t>(cbShown));
    }

private:
    int m_nMaster = -1;
    int m_nSlave = -1;
};

// What a function writes to a stream, which goes to a file from here on.
template <typename Write>
std::string written(FILE* pStream, Write write)
{
    FILE* const pFile = tmpfile();
    dup2(fileno(pFile), fileno(pStream));
    write();
    fflush(nullptr);
    std::string strText(static_cast<size_t>(lseek(fileno(pFile), 0, SEEK_END)), '\0');
    EXPECT_EQ(static_cast<ssize_t>(strText.size()), pread(fileno(pFile), strText.data(), strText.size(), 0));
    fclose(pFile);
    return strText;
}

const std::string ID(127, 'x');

} // namespace

TEST(Streams, AreAllThereAndNoMoreThanThese)
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

TEST(Result, IsEscapedForATerminalAlone)
{
    EXPECT_EQ("\u00e4\xff", written(stdout, [] { tool::print("\u00e4\xff"); }));
    const Terminal terminal(stdout);
    EXPECT_EQ("\"\\u00e4\\udcff\\ud83d\\ude00\"",
              terminal.shown([] { tool::print("\"\u00e4\xff\U0001f600\""); }));
    EXPECT_EQ("\\udcff", terminal.shown([] { tool::print("\xff"); }));
    EXPECT_EQ("\\xc3\\xa4\r\n", terminal.shown([] { tool::printLine("\u00e4"); }));
    ASSERT_NE(nullptr, setlocale(LC_CTYPE, "C.UTF-8"));
    EXPECT_EQ("\"\u00e4\\udcff\U0001f600\"", terminal.shown([] { tool::print("\"\u00e4\xff\U0001f600\""); }));
    EXPECT_EQ("\u00e4\\x1b\r\n", terminal.shown([] { tool::printLine("\u00e4\x1b"); }));
}

TEST(Result, OfAsciiTakesNoMemory)
{
    const Terminal terminal(stdout);
    g_pAllocation = [] { throw std::bad_alloc(); };
    tool::print(ID);
    g_pAllocation = nullptr;
    EXPECT_EQ(ID, terminal.shown([] {}));
}

TEST(Errors, AreEscapedForATerminalAlone)
{
    EXPECT_EQ("vemo-access-token: \u00e4\\x1b\n", written(stderr, [] { tool::complain("\u00e4\x1b"); }));
    EXPECT_EQ("\u00e4\x1b", tool::errorLine("\u00e4\x1b"));
    const Terminal terminal(stderr);
    EXPECT_EQ("vemo-access-token: \\xc3\\xa4\\x1b\r\n", terminal.shown([] { tool::complain("\u00e4\x1b"); }));
    EXPECT_EQ("\\xc3\\xa4\\x1b", tool::errorLine("\u00e4\x1b"));
}

// As twice in one process, with another stdout: each has its own, and the result goes where it did.
TEST(LogLines, AreKeptUntilTheEnd)
{
    FILE* const pBefore = stdout;
    for (const char* szResult : {"first", "second"}) {
        FILE* const pFile = tmpfile();
        stdout = pFile;
        EXPECT_EQ(std::string("then line of the ") + szResult + "\n", written(stderr, [szResult] {
                      const tool::LogLines logLines(true);
                      printf("line of the %s\n", szResult);
                      tool::print(szResult);
                      fputs("then ", stderr);
                  }));
        EXPECT_EQ(pFile, stdout);
        char szWritten[100] = "";
        rewind(pFile);
        EXPECT_EQ(strlen(szResult), fread(szWritten, 1, sizeof(szWritten), pFile));
        EXPECT_STREQ(szResult, szWritten);
        stdout = pBefore;
        fclose(pFile);
    }
}
