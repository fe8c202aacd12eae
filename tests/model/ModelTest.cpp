// Random operations on the library and on a plain model of it in memory: results, outputs and table agree.

#include <gtest/gtest.h>

#include <algorithm>
#include <deque>
#include <set>

#include "Draws.h"
#include "Figures.h"
#include "ModelCalls.h"
#include "Table.h"
#include "TokenStore.h"
#include "World.h"

namespace {

const size_t REPORTED = 12;    // operations that a failure shows
const size_t TEXT_SHOWN = 500; // of each

std::string shown(const Json::Value& jCall)
{
    const std::string strText = jsonText(jCall);
    return ::testing::PrintToString(strText.substr(0, TEXT_SHOWN)) +
           (TEXT_SHOWN < strText.size() ? "..." : "");
}

} // namespace

// For the messages of GoogleTest.
static std::ostream& operator<<(std::ostream& stream, const Outcome& outcome)
{
    return stream << (outcome.strThrown.empty() ? std::to_string(outcome.nResult) : outcome.strThrown) << ", "
                  << shown(outcome.jCall);
}

namespace {

class ModelCheck : public ::testing::Test {
protected:
    // Draws operations and runs each on both, until they do not agree.
    void runAll(int64_t nOperations)
    {
        std::vector<const Operation*> choices; // each as often as it weighs
        for (const Operation& operation : operations()) {
            choices.insert(choices.end(), operation.nWeight, &operation);
        }
        for (int64_t i = 0; i < nOperations; ++i) {
            m_draws.moveClock();
            ASSERT_NO_FATAL_FAILURE(runOne(*choices[m_draws.below(choices.size())]));
        }
        for (const Operation& operation : operations()) {
            EXPECT_TRUE(m_succeeded.count(operation.szName)) << operation.szName << " never succeeded";
        }
    }

    void runOne(const Operation& operation)
    {
        Json::Value jCall(Json::objectValue);
        for (const char* szArgument : operation.szArguments) {
            jCall[szArgument] = m_draws.argument(szArgument);
        }
        m_history.emplace_back("at " + std::to_string(worldClock()) + " " + operation.szName, jCall);
        if (REPORTED < m_history.size()) {
            m_history.pop_front();
        }
        const Outcome library = operation.run(m_library, jCall);
        m_model.setGenerated(library.jCall.get("made", "").asString());
        const Outcome model = operation.run(m_model, jCall);
        ASSERT_EQ(model, library) << "expected is the model's\n" << history();
        ASSERT_EQ("", m_table.differenceFrom(m_model.rows())) << history();
        if (library.strThrown.empty() && 0 <= library.nResult) {
            m_succeeded.insert(operation.szName);
        }
    }

    // The last operations, and how to repeat them.
    std::string history() const
    {
        std::string strText = "seed " + std::to_string(seed()) + ", the last operations:\n";
        for (const auto& [strOperation, jCall] : m_history) {
            strText.append("  ").append(strOperation).append(" ").append(shown(jCall)).append("\n");
        }
        return strText;
    }

    const TokenStore m_files;
    Library m_library;
    const Database m_pDb = m_files.open();
    const Table m_table{m_pDb.get()};
    Model m_model;
    Draws m_draws{seed(), m_model.rows()};
    std::deque<std::pair<std::string, Json::Value>> m_history;
    std::set<std::string> m_succeeded;
};

} // namespace

TEST_F(ModelCheck, LibraryDoesWhatTheModelDoes)
{
    runAll(scaled(VEMO_TEST_OPERATIONS));
}

#ifdef VEMO_TEST_GATE
TEST_F(ModelCheck, GateGrantsWhatTheModelGrants)
{
    m_library.pGrantEx = &grantAtTheGate;
    runAll(scaled(std::min(VEMO_TEST_OPERATIONS, 10000)));
}
#endif
