// Random operations on the library and on a plain model of it in memory: results, outputs and table agree.

#include <gtest/gtest.h>

#include <algorithm>
#include <deque>
#include <numeric>
#include <sstream>

#include "Draws.h"
#include "Figures.h"
#include "GateGrant.h"
#include "ModelCalls.h"
#include "Table.h"
#include "TokenStore.h"
#include "World.h"

namespace {

const size_t REPORTED = 12;    // operations that a failure shows
const size_t TEXT_SHOWN = 500; // of each

// Short, and with bytes that cannot be printed in hexadecimal.
std::string shown(const Json::Value& jCall)
{
    const std::string strText = jsonText(jCall);
    std::string strShown;
    for (const char c : strText.substr(0, TEXT_SHOWN)) {
        char szByte[8];
        snprintf(szByte, sizeof(szByte), isprint(static_cast<unsigned char>(c)) ? "%c" : "\\x%02x",
                 static_cast<unsigned char>(c));
        strShown += szByte;
    }
    return strShown + (TEXT_SHOWN < strText.size() ? "..." : "");
}

} // namespace

// For the messages of GoogleTest.
static std::ostream& operator<<(std::ostream& stream, const Outcome& outcome)
{
    return stream << (outcome.strThrown.empty() ? std::to_string(outcome.nResult) : outcome.strThrown) << ", "
                  << shown(outcome.jCall);
}

namespace {

struct Tally {
    int64_t nSucceeded = 0;
    int64_t nRefused = 0;
    int64_t nThrown = 0;

    void count(const Outcome& outcome)
    {
        ++(!outcome.strThrown.empty() ? nThrown : 0 > outcome.nResult ? nRefused : nSucceeded);
    }
};

// Another connection than the library's.
sqlite3* openDatabase(const std::string& strPath)
{
    sqlite3* pDb = nullptr;
    EXPECT_EQ(SQLITE_OK, sqlite3_open_v2(strPath.c_str(), &pDb, SQLITE_OPEN_READONLY, nullptr));
    return pDb;
}

class ModelCheck : public ::testing::Test {
protected:
    // Draws an operation and runs it on both. Fails fatally if they do not agree.
    void runOne()
    {
        m_draws.moveClock();
        const size_t nOperation = drawOperation();
        const Operation& operation = operations()[nOperation];
        Json::Value jCall(Json::objectValue);
        for (const char* szArgument : operation.szArguments) {
            jCall[szArgument] = m_draws.argument(szArgument);
        }
        remember(operation, jCall);

        const Outcome library = operation.run(m_library, jCall);
        m_model.service.setGenerated(library.jCall.get("made", "").asString());
        const Outcome model = operation.run(m_model, jCall);
        ASSERT_EQ(model, library) << "expected is the model's\n" << history();
        ASSERT_EQ("", m_table.differenceFrom(m_model.store.rows())) << history();
        m_tallies[nOperation].count(library);
        m_nRows += static_cast<int64_t>(m_model.store.rows().size());
    }

    void runAll(const std::string& strName, int64_t nOperations)
    {
        for (int64_t i = 0; i < nOperations && !HasFatalFailure(); ++i) {
            runOne();
        }
        if (HasFatalFailure()) {
            return;
        }
        for (size_t i = 0; i < m_tallies.size(); ++i) {
            EXPECT_LT(0, m_tallies[i].nSucceeded) << operations()[i].szName << " never succeeded";
        }
        print(strName, nOperations);
    }

    size_t drawOperation()
    {
        size_t nDraw = m_draws.below(m_nWeights);
        size_t i = 0;
        while (operations()[i].nWeight <= nDraw) {
            nDraw -= operations()[i++].nWeight;
        }
        return i;
    }

    void remember(const Operation& operation, const Json::Value& jCall)
    {
        ++m_nNumber;
        m_history.push_back({operation.szName, worldClock(), jCall});
        if (REPORTED < m_history.size()) {
            m_history.pop_front();
        }
    }

    // The last operations, and how to repeat them.
    std::string history() const
    {
        std::string strText = "seed " + std::to_string(seed()) + ", operation " + std::to_string(m_nNumber) +
                              ", the last of these:\n";
        for (const Call& call : m_history) {
            strText.append("  at ").append(std::to_string(call.time)).append(" ").append(call.szName);
            strText.append(" ").append(shown(call.jArguments)).append("\n");
        }
        return strText;
    }

    void print(const std::string& strName, int64_t nOperations) const
    {
        Tally all;
        for (const Tally& tally : m_tallies) {
            all.nSucceeded += tally.nSucceeded;
            all.nRefused += tally.nRefused;
            all.nThrown += tally.nThrown;
        }
        std::ostringstream text;
        text << nOperations << " operations, " << all.nSucceeded << " of them succeeded, " << all.nRefused
             << " were refused, " << all.nThrown << " threw; " << m_nRows / nOperations
             << " tokens on average";
        figure(strName, text.str());
    }

    const TokenStore m_files;
    Library m_library;
    const std::unique_ptr<sqlite3, decltype(&sqlite3_close)> m_pDb{openDatabase(m_files.path()),
                                                                   &sqlite3_close};
    const Table m_table{m_pDb.get()};
    Model m_model;
    Draws m_draws{seed(), m_model.store.rows()};
    std::vector<Tally> m_tallies = std::vector<Tally>(operations().size());

private:
    struct Call {
        const char* szName;
        time_t time;
        Json::Value jArguments;
    };

    const size_t m_nWeights =
        std::accumulate(operations().begin(), operations().end(), size_t(0),
                        [](size_t nSum, const Operation& operation) { return nSum + operation.nWeight; });
    int64_t m_nNumber = 0;
    int64_t m_nRows = 0;
    std::deque<Call> m_history;
};

} // namespace

TEST_F(ModelCheck, LibraryDoesWhatTheModelDoes)
{
    runAll("model check", scaled(VEMO_TEST_OPERATIONS));
}

#ifdef VEMO_TEST_GATE
TEST_F(ModelCheck, GateGrantsWhatTheModelGrants)
{
    m_library.functions.grantEx = &grantAtTheGate;
    runAll("model check of the gate", scaled(std::min(VEMO_TEST_OPERATIONS, 10000)));
}
#endif
