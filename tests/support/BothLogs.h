// Tests of the store that are run with either destination of the log.

#ifndef TESTS_BOTH_LOGS_H
#define TESTS_BOTH_LOGS_H

#include "AccessTokenUtil.h"
#include "Opening.h"

// A line of the store with the errno at which it is written.
struct Line {
    std::string strOnStdout;
    int nErrno;
};

inline Line ordinaryLine(const std::string& strMessage, int nErrno = 0)
{
    return {ordinary(STORE, strMessage), nErrno};
}

inline Line failLine(const std::string& strMessage, int nErrno = 0)
{
    return {fail(STORE, strMessage, nErrno), nErrno};
}

inline Line failedLine(const std::string& strCondition, int nErrno = 0)
{
    return {failed(STORE, strCondition, nErrno), nErrno};
}

// A case and where its lines are to go. Cases are aggregates with a szName, by which they go.
template <typename Case>
struct LogCase {
    Case theCase;
    Destination destination;
};

template <typename Case>
std::ostream& operator<<(std::ostream& stream, const LogCase<Case>& logCase)
{
    return stream << logCase.theCase.szName
                  << (Destination::Stdout == logCase.destination ? "OnStdout" : "InSystemLog");
}

template <typename Case>
auto inBothLogs(const std::vector<Case>& cases)
{
    std::vector<LogCase<Case>> logCases;
    for (const Case& theCase : cases) {
        logCases.push_back({theCase, Destination::Stdout});
        logCases.push_back({theCase, Destination::Syslog});
    }
    return ::testing::ValuesIn(logCases);
}

// Tests of each case once with the lines on standard output and once in the system log.
template <typename Case>
class InBothLogs : public StoreTest, public ::testing::WithParamInterface<LogCase<Case>> {
protected:
    InBothLogs() : StoreTest(InBothLogs::GetParam().destination) {}

    const Case& theCase() const { return this->GetParam().theCase; }

    void expectLines(const std::vector<Line>& lines) const
    {
        Texts expected;
        for (const Line& line : lines) {
            const Texts texts = {line.strOnStdout};
            const bool blStdout = Destination::Stdout == destination();
            expected = expected + (blStdout ? texts : inSystemLog(texts, line.nErrno));
        }
        EXPECT_EQ(expected, takeLines(destination()));
    }
};

struct Switches {
    const char* szName;
    bool blDebug;
    bool blLog; // of cleanExpireToken
};

const Switches QUIET = {"Quiet", false, false};
const Switches LOUD = {"Loud", false, true};
const Switches DEBUG = {"Debug", true, false};
const Switches LOUD_DEBUG = {"LoudDebug", true, true};

class WithSwitches : public InBothLogs<Switches> {
protected:
    void SetUp() override
    {
        InBothLogs::SetUp();
        openWithTwoRows(m_db);
        if (theCase().blDebug) {
            VEMO_ACCESS_TOKEN::debugInfo(true);
        }
    }

    // Expects a line, always or in debug mode only.
    void say(const Line& line) { m_lines.push_back(line); }
    void sayInDebug(const Line& line)
    {
        if (theCase().blDebug) {
            say(line);
        }
    }

    AccessTokenDbApi m_db;
    std::vector<Line> m_lines;
};

#endif
