// The commands of the tool while the system fails: each system call on a file and each allocation, once and
// from then on; and a signal in front of each of these calls.

#include <gtest/gtest.h>
#include <signal.h>

#include <algorithm>
#include <iterator>
#include <memory>

#include "Figures.h"
#include "Operations.h"
#include "Scene.h"
#include "tools/Commands.h"

namespace {

const int64_t STRIDE_OF_MEMORY = 32; // of the many allocations, these every day
const int64_t LAST_CALLS = 12;       // each of them counts: they come when the change has been made

const std::string TID = idOf("three");

struct Command {
    const char* szName;
    std::vector<std::string> strArguments;
    bool blStore = true;   // finds one
    int64_t nStride = 1;   // more for one that does the same over and over
    bool blChanges = true; // the store, or a file
    bool blNoName = true;  // the file system has files without a name
};

// For the messages of GoogleTest.
void PrintTo(const Command& command, std::ostream* pStream)
{
    *pStream << command.szName;
}

const bool READS = false;

const Command COMMANDS[] = {
    {"create", {"create", "--uid", "0", "--function", "VPN", "--allow", "Example.Api:get"}},
    {"init", {"init"}, false},
    {"list", {"list"}, true, 1, READS},
    {"list_json", {"list", "-o", "json"}, true, 1, READS},
    {"show", {"show", TID}, true, 1, READS},
    {"check", {"check", TID, "Example.Api", "get"}, true, 1, READS},
    {"grant", {"grant", TID, "Example.Api", "get"}},
    {"update", {"update", TID, "--uses", "7", "--add-allow", "Example.Api:put"}},
    {"rotate", {"rotate", TID}},
    {"rotate_grace", {"rotate", TID, "--grace", "1h"}},
    {"revoke", {"revoke", TID}},
    {"revoke_all", {"revoke", "--all", "--yes"}},
    {"purge", {"purge"}},
    {"stats", {"stats"}, true, 1, READS},
    {"export", {"export"}, true, 1, READS},
    {"export_file", {"export", "OUT"}},
    {"export_named_file", {"export", "OUT"}, true, 1, true, false},
    {"import", {"import", "IN"}},
    {"doctor", {"doctor"}, true, 2, READS},
    {"doctor_repair", {"doctor", "--repair"}, true, 6},
    {"tune", {"tune"}, true, 16},
    {"tune_wal", {"tune", "--wal"}, true, 16},
    {"generate", {"generate"}, true, 1, READS},
};

template <typename Condition>
std::vector<Command> commandsThat(const Condition& condition)
{
    std::vector<Command> commands;
    std::copy_if(std::begin(COMMANDS), std::end(COMMANDS), std::back_inserter(commands), condition);
    return commands;
}

bool change(const Command& command)
{
    return command.blChanges;
}

// The others make some more changes, to measure them.
bool changeAsTheLast(const Command& command)
{
    return command.blChanges && command.strArguments[0] != "tune";
}

class ToolFault : public ::testing::TestWithParam<Command> {
protected:
    void SetUp() override
    {
        if (!GetParam().blNoName) {
            setenv("VEMO_TEST_NO_TMPFILE", "", 1);
        }
        try {
            m_pScene = std::make_unique<Scene>(GetParam().strArguments, GetParam().blStore);
        } catch (const NoAnswers& exception) {
            GTEST_SKIP() << exception.what();
        }
    }

    int64_t strideOf(int64_t nStride) const
    {
        return std::max<int64_t>(1, nStride * GetParam().nStride / scaled(1));
    }

    void judge(const Fault& fault)
    {
        ++m_nRuns;
        EXPECT_EQ("", m_pScene->judge(fault)) << "call " << fault.nFirst << " to " << fault.nLast;
    }

    // Each call fails, or each of a stride and each of the last: once, and from then on.
    void judgeEach(Fault::Kind kind, int64_t nStride)
    {
        const int64_t nCalls = m_pScene->calls(kind);
        const int64_t nStart = 1 + static_cast<int64_t>(seed() % static_cast<uint64_t>(nStride));
        const int64_t nLast = std::max(nStart, nCalls - LAST_CALLS + 1);
        for (int64_t nCall = nStart; nCall <= nCalls && !HasFailure();) {
            judge({kind, nCall, nCall});
            judge({kind, nCall, INT64_MAX});
            nCall = nCall < nLast ? std::min(nCall + nStride, nLast) : nCall + 1;
        }
        m_nCalls += nCalls;
    }

    void print(const std::string& strWhat) const
    {
        figure("tool, " + strWhat, std::string(GetParam().szName) + ": " + std::to_string(m_nCalls) +
                                       " calls, " + std::to_string(m_nRuns) + " runs");
    }

    std::unique_ptr<Scene> m_pScene;
    int64_t m_nCalls = 0;
    int64_t m_nRuns = 0;
};

class ToolChange : public ToolFault {};
class ToolLastChange : public ToolFault {};

} // namespace

TEST_P(ToolFault, IsReportedForEachSystemCall)
{
    judgeEach(Fault::Kind::Error, strideOf(1));
    judgeEach(Fault::Kind::FullDisk, strideOf(1));
    print("system calls");
}

TEST_P(ToolFault, IsReportedForEachAllocation)
{
    judgeEach(Fault::Kind::Memory, strideOf(STRIDE_OF_MEMORY));
    if (0 == m_nRuns) { // it has nothing to do behind the command line
        judgeEach(Fault::Kind::Parsing, strideOf(STRIDE_OF_MEMORY));
    }
    print("allocations");
}

// Those that can be caught make a difference where a file must go, or an id must be told.
TEST_P(ToolChange, IsAllOrNothingAfterASignal)
{
    const std::string& strCommand = GetParam().strArguments[0];
    const auto signals = strCommand == "export" || strCommand == "create" || strCommand == "rotate"
                             ? std::vector<int>{SIGKILL, SIGINT, SIGTERM}
                             : std::vector<int>{SIGKILL};
    m_nCalls = m_pScene->calls(Fault::Kind::Signal);
    for (int64_t nCall = 1; nCall <= m_nCalls; nCall += strideOf(1)) {
        for (const int nSignal : signals) {
            judge({Fault::Kind::Signal, nCall, nCall, nSignal});
        }
    }
    print("signals");
}

// SQLite's last sync is that of the database, before the end of the journal makes the change. An export has
// its name when its directory is synced.
TEST_P(ToolLastChange, IsOnTheDiskWhenItReturns)
{
    const bool blExports = GetParam().strArguments[0] == "export";
    EXPECT_EQ(blExports ? m_pScene->files() : m_pScene->storeDirectory(),
              m_pScene->undisturbed().strSynced.back());
}

// The name of the private directory stands in the one above, for which "/" stands here.
TEST(ToolInit, PutsTheDirectoryOnTheDiskBeforeWhatStandsInIt)
{
    try {
        const Scene scene({"init"}, false);
        const std::vector<std::string> strSynced = scene.undisturbed().strSynced;
        ASSERT_LE(2U, strSynced.size());
        EXPECT_EQ("/", strSynced[0]);
        EXPECT_EQ(scene.storeDirectory(), strSynced[1]);
    } catch (const NoAnswers& exception) {
        GTEST_SKIP() << exception.what();
    }
}

TEST(ToolFaults, AreMetByEachCommand)
{
    for (const tool::CommandEntry& entry : tool::COMMANDS) {
        const auto isIt = [&entry](const Command& command) {
            return command.strArguments[0] == entry.szName;
        };
        EXPECT_TRUE(!commandsThat(isIt).empty() || entry.szName == std::string("help")) << entry.szName;
    }
}

const auto NAME = [](const auto& instance) { return instance.param.szName; };

INSTANTIATE_TEST_SUITE_P(Each, ToolFault, ::testing::ValuesIn(COMMANDS), NAME);
INSTANTIATE_TEST_SUITE_P(Each, ToolChange, ::testing::ValuesIn(commandsThat(change)), NAME);
INSTANTIATE_TEST_SUITE_P(Each, ToolLastChange, ::testing::ValuesIn(commandsThat(changeAsTheLast)), NAME);
