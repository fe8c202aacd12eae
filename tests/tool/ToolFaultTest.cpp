// The commands of the tool while the system fails: each system call on a file and each allocation fails,
// alone or with all later ones; and a signal comes before each of these calls.

#include <gtest/gtest.h>
#include <signal.h>

#include <algorithm>
#include <cctype>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <sstream>

#include "Figures.h"
#include "Operations.h"
#include "ToolRun.h"
#include "tools/Commands.h"
#include "vemo-access-token.h"

namespace {

namespace fs = std::filesystem;

const int64_t STRIDE_OF_MEMORY = 32; // of the many allocations, one in so many fails in a usual run
const int64_t LAST_CALLS = 12;       // each of them is tried: they come after the change

const std::string TID = idOf("three");
const std::string OLD_FILE = "what was there\n";

struct Command {
    const char* szName;
    // "IN" is a file of two tokens, "OUT" one that holds something else yet.
    std::vector<std::string> strArguments;
    bool blStore = true;  // finds one
    int64_t nStride = 1;  // more for one that does the same over and over
    bool blNoName = true; // the file system has files without a name
};

const Command COMMANDS[] = {
    {"create", {"create", "--uid", "0", "--function", "VPN", "--allow", "Example.Api:get"}},
    {"init", {"init"}, false},
    {"list", {"list"}},
    {"list_json", {"list", "-o", "json"}},
    {"show", {"show", TID}},
    {"check", {"check", TID, "Example.Api", "get"}},
    {"grant", {"grant", TID, "Example.Api", "get"}},
    {"update", {"update", TID, "--uses", "7", "--add-allow", "Example.Api:put"}},
    {"rotate", {"rotate", TID}},
    {"rotate_grace", {"rotate", TID, "--grace", "1h"}},
    {"revoke", {"revoke", TID}},
    {"revoke_all", {"revoke", "--all", "--yes"}},
    {"purge", {"purge"}},
    {"stats", {"stats"}},
    {"export", {"export"}},
    {"export_file", {"export", "OUT"}},
    {"export_named_file", {"export", "OUT"}, true, 1, false},
    {"import", {"import", "IN"}},
    {"doctor", {"doctor"}, true, 2},
    {"doctor_repair", {"doctor", "--repair"}, true, 6},
    {"tune", {"tune"}, true, 16},
    {"tune_wal", {"tune", "--wal"}, true, 16},
    {"generate", {"generate"}},
};

// The sentences that name the cause. SQLite does not say why it cannot make a journal, continues where it may
// only read, and takes an error of reading for damage.
const std::map<Fault::Kind, std::vector<std::string>> CAUSES = {
    {Fault::Kind::Error,
     {"Input/output error", "disk I/O error", "unable to open database file",
      "attempt to write a readonly database", "database disk image is malformed",
      "the kernel gives no random numbers"}},
    {Fault::Kind::FullDisk,
     {"No space left on device", "database or disk is full", "disk I/O error", "unable to open database file",
      "attempt to write a readonly database"}},
    {Fault::Kind::Memory, {"out of memory", "Cannot allocate memory"}},
};

bool contains(const std::string& strText, const std::string& strPart)
{
    return std::string::npos != strText.find(strPart);
}

std::string contentsOf(const fs::path& path)
{
    std::ostringstream contents;
    contents << std::ifstream(path, std::ios::binary).rdbuf();
    return contents.str();
}

// The tool's output, without parts that differ between runs: a new id, which comes first, times, and the name
// of a user, which it omits if the look-up fails.
std::string withoutChance(std::string strText)
{
    const auto idEnd = std::find_if_not(strText.begin(), strText.end(), ::isalnum);
    if (idEnd - strText.begin() >= VEMO_ATOKEN_LENGTH_MIN) {
        strText.replace(strText.begin(), idEnd, "ID");
    }
    for (size_t nAt = 0; std::string::npos != (nAt = strText.find("root", nAt));) {
        strText.erase(nAt, strlen("root"));
    }
    const auto isChance = [](char c) { return contains("0123456789 ()", {c}); };
    strText.erase(std::remove_if(strText.begin(), strText.end(), isChance), strText.end());
    return strText;
}

// The lines of a run on standard error, without those of an undisturbed run.
std::vector<std::string> sentences(const std::string& strError, const std::string& strUndisturbed)
{
    std::vector<std::string> strLines;
    std::istringstream stream(strError);
    for (std::string strLine; std::getline(stream, strLine);) {
        if (!contains(strUndisturbed, strLine + "\n")) {
            strLines.push_back(strLine);
        }
    }
    return strLines;
}

// What a command finds and what it leaves: the store, and files beside it.
class ToolFault : public ::testing::TestWithParam<Command> {
protected:
    // Runs the command once undisturbed, to know what it gives.
    void SetUp() override
    {
        if (!GetParam().blNoName) {
            setenv("VEMO_TEST_NO_TMPFILE", "", 1);
        }
        if (!canRunTool()) {
            GTEST_SKIP() << "the kernel does not let one process answer the system calls of another";
        }
        m_strArguments = GetParam().strArguments;
        for (std::string& strArgument : m_strArguments) {
            strArgument =
                strArgument == "IN" || strArgument == "OUT" ? files() + "/" + strArgument : strArgument;
        }
        makeTable(m_store);
        for (const char* szName : {"four", "five"}) {
            insertToken(m_store, szName, "'',0,4102444800,2,1,'VPN'");
        }
        m_strExport = runTool({"export"}).strOutput;
        prepare();
        m_strBefore = m_store.state();
        runTool({"purge"});
        m_strPurged = m_store.state();
        prepare();
        m_undisturbed = runTool(m_strArguments);
        m_strAfter = m_store.state();
        m_strNewFile = contentsOf(files() + "/OUT");
    }

    void TearDown() override
    {
        std::error_code ignored;
        fs::remove_all(files(), ignored);
    }

    std::string files() const { return m_store.directory() + ".files"; }
    bool isChanged() const { return m_strBefore != m_strAfter || OLD_FILE != m_strNewFile; }

    void prepare() const
    {
        fs::remove_all(files());
        fs::create_directory(files());
        fs::permissions(files(), fs::perms(0775)); // others could put names there
        std::ofstream(files() + "/IN") << m_strExport;
        std::ofstream(files() + "/OUT") << OLD_FILE;
        fs::create_directory(m_store.directory());
        prepareStore(m_store, GetParam().blStore ? operations().back() : operations().front());
        if (!GetParam().blStore) {
            fs::remove(m_store.directory());
        }
    }

    // How many calls a fault of this kind can happen to.
    int64_t calls(Fault::Kind kind) const
    {
        prepare();
        return runTool(m_strArguments, {kind}).nCalls;
    }

    int64_t strideOf(int64_t nStride) const
    {
        return std::max<int64_t>(1, nStride * GetParam().nStride / scaled(1));
    }

    // Runs the command and judges how it ended:
    // - the store is sound and as before the command, after its purge or after all of it; the file OUT is the
    //   old one or the whole new one, and there is no other
    // - it succeeds, and all is done and said as undisturbed; or it fails with one sentence, which names the
    //   cause, and says so if the change was made even so
    // - it ends by itself, unless the fault is a signal
    void judge(const Fault& fault)
    {
        ++m_nRuns;
        prepare();
        const Ending ending = runTool(m_strArguments, fault);
        SCOPED_TRACE("call " + std::to_string(fault.nFirst) + " to " + std::to_string(fault.nLast) +
                     "; said: " + ending.strError + "; printed: " + ending.strOutput.substr(0, 500));
        const std::string strState = fs::exists(m_store.directory()) ? m_store.state() : STATE_MISSING;
        const bool blHalfMade = !GetParam().blStore && (strState == STATE_NO_TABLE || strState.empty());
        EXPECT_TRUE(strState == m_strBefore || strState == m_strPurged || strState == m_strAfter ||
                    blHalfMade)
            << "a third state: " << strState.substr(0, 200);
        judgeFiles(fault);
        ASSERT_EQ(fault.nSignal, ending.nSignal);
        const bool blTellsId = m_strArguments[0] == "create" || m_strArguments[0] == "rotate";
        EXPECT_FALSE(blTellsId && SIGKILL != fault.nSignal && strState == m_strAfter &&
                     ending.strOutput.empty() && !contains(ending.strError, "cannot be taken back"))
            << "a token whose id nobody knows";
        if (0 != ending.nSignal) {
            return;
        }
        if (ending.nStatus == m_undisturbed.nStatus && ending.strError == m_undisturbed.strError &&
            withoutChance(ending.strOutput) == withoutChance(m_undisturbed.strOutput)) {
            EXPECT_TRUE(strState == m_strAfter && contentsOf(files() + "/OUT") == m_strNewFile)
                << "reported success, yet it is not done";
        } else if (m_strArguments[0] ==
                   "doctor") { // what it cannot look at is a finding, if it can print that
            const bool blMute =
                Fault::Kind::Memory == fault.kind || contains(ending.strError, "cannot write the result");
            EXPECT_TRUE(5 == ending.nStatus || (0 == ending.nStatus && strState == m_strAfter) ||
                        (4 == ending.nStatus && blMute))
                << ending.nStatus;
        } else {
            judgeFailure(ending, fault, strState);
        }
    }

    void judgeFiles(const Fault& fault) const
    {
        const std::string strFile = contentsOf(files() + "/OUT");
        EXPECT_TRUE(strFile == OLD_FILE || strFile == m_strNewFile) << "half a file";
        for (const auto& entry : fs::directory_iterator(files())) {
            const std::string strName = entry.path().filename();
            // It is there to stay when the process cannot remove it.
            const bool blExcused = (SIGKILL == fault.nSignal || Fault::Kind::Error == fault.kind) &&
                                   0 == strName.compare(0, 4, "OUT.") &&
                                   (entry.status().permissions() & fs::perms::all) == fs::perms(0600);
            EXPECT_TRUE(strName == "IN" || strName == "OUT" || blExcused) << "left " << strName;
        }
    }

    void judgeFailure(const Ending& ending, const Fault& fault, const std::string& strState) const
    {
        const std::vector<std::string> strSentences = sentences(ending.strError, m_undisturbed.strError);
        ASSERT_EQ(1U, strSentences.size());
        EXPECT_EQ(0U, strSentences[0].find("vemo-access-token: "));
        EXPECT_EQ(contains(ending.strError, files() + "/IN: ") ? 2 : 4, ending.nStatus);
        const std::vector<std::string>& strCauses = CAUSES.at(fault.kind);
        EXPECT_TRUE(std::any_of(strCauses.begin(), strCauses.end(), [&](const std::string& strCause) {
            return contains(ending.strError, strCause);
        })) << "no cause is named";
        if (GetParam().blStore) { // else what it has made stays, and is seen by calling it again
            const bool blSaysChange = contains(ending.strError, "the change was made");
            const bool blSaysPerhaps = contains(ending.strError, "the change may have been made");
            const bool blMade = strState == m_strAfter && strState != m_strBefore;
            EXPECT_TRUE(!blMade || blSaysChange || blSaysPerhaps) << "the change was made, unsaid";
            EXPECT_TRUE(strState == m_strAfter || !blSaysChange) << "the change was not made, but it says so";
        }
    }

    // Each call fails, or one in each stride and each of the last: alone, or with all later ones.
    void judgeEach(Fault::Kind kind, int64_t nStride)
    {
        const int64_t nCalls = calls(kind);
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

    TokenStore m_store;
    std::vector<std::string> m_strArguments;
    std::string m_strExport;
    std::string m_strBefore;
    std::string m_strPurged;
    std::string m_strAfter;
    std::string m_strNewFile;
    Ending m_undisturbed;
    int64_t m_nCalls = 0;
    int64_t m_nRuns = 0;
};

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
    print("allocations");
}

// Signals that can be caught matter where a file must be removed, or an id must be printed.
TEST_P(ToolFault, IsAllOrNothingAfterASignal)
{
    const std::string& strCommand = GetParam().strArguments[0];
    const auto signals = strCommand == "export" || strCommand == "create" || strCommand == "rotate"
                             ? std::vector<int>{SIGKILL, SIGINT, SIGTERM}
                             : std::vector<int>{SIGKILL};
    m_nCalls = isChanged() ? calls(Fault::Kind::Signal) : 0;
    for (int64_t nCall = 1; nCall <= m_nCalls; nCall += strideOf(1)) {
        for (const int nSignal : signals) {
            judge({Fault::Kind::Signal, nCall, nCall, nSignal});
        }
    }
    print("signals");
}

TEST(ToolFaults, AreMetByEachCommand)
{
    for (const tool::CommandEntry& entry : tool::COMMANDS) {
        const auto isIt = [&entry](const Command& command) {
            return command.strArguments[0] == entry.szName;
        };
        EXPECT_TRUE(std::any_of(std::begin(COMMANDS), std::end(COMMANDS), isIt) ||
                    entry.szName == std::string("help"))
            << entry.szName;
    }
}

INSTANTIATE_TEST_SUITE_P(Each, ToolFault, ::testing::ValuesIn(COMMANDS),
                         [](const auto& instance) { return instance.param.szName; });
