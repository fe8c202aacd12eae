#include "Oracle.h"

#include <gtest/gtest.h>
#include <sqlite3.h>
#include <unistd.h>

#include <cstring>
#include <new>
#include <stdexcept>

#include "AccessTokenApi.h"
#include "ProcessState.h"

Oracle::Oracle(const TokenStore& store, const Operation& operation) : m_store(store), m_operation(operation)
{
    prepareStore(store, operation);
    m_strBefore = store.state();
    AccessTokenApi().cleanExpireToken(true);
    m_strPurged = store.state();
    prepareStore(store, operation);
    m_nResult = run().value_or(-1);
    m_strAfter = store.state();
    if (0 > m_nResult) {
        throw std::logic_error(std::string("fails undisturbed: ") + operation.szName);
    }
    if (operation.blPurges && !operation.blCreatesStore) {
        insertExpired(store);
    }
    m_strAfterWithoutPurge = store.state();
}

std::optional<int> Oracle::run() const
{
    try {
        return m_operation.run();
    } catch (const std::bad_alloc&) {
        return std::nullopt;
    } catch (const Json::RuntimeError&) { // jsoncpp's report that it got no memory
        return std::nullopt;
    }
}

bool Oracle::isDone(const std::string& strState) const
{
    return strState == m_strAfter || strState == m_strAfterWithoutPurge;
}

bool Oracle::allows(const std::string& strState) const
{
    return strState == m_strBefore || strState == m_strPurged || isDone(strState) ||
           (m_operation.blCreatesStore && strState == STATE_NO_TABLE);
}

std::string Oracle::judge(const std::function<void()>& arm, const std::function<void()>& disarm,
                          const std::function<uid_t()>& uidAfter) const
{
    prepareStore(m_store, m_operation);
    Log::clear();
    static_cast<void>(seteuid(UID_CALLER));
    const std::string strProcess = processState();

    arm();
    const std::optional<int> result = run();
    disarm();
    const bool blDone = result && 0 <= *result;

    std::string strWrong;
    if (result && !blDone && !Log::text()[0]) {
        strWrong += "a failure without a log line; ";
    }
    if (blDone && *result != m_nResult) {
        strWrong += "another result: " + std::to_string(*result) + "; ";
    }
    if (geteuid() != (strstr(Log::text(), "open sqlite failed") ? 0 : uidAfter())) {
        strWrong += "another effective uid; ";
    }
    const std::string strProcessAfter = processState();
    if (strProcessAfter != strProcess) {
        strWrong += "the process changed: " + strProcess + "to: " + strProcessAfter + "; ";
    }
    if (0 != sqlite3_memory_used()) {
        strWrong += "SQLite still holds memory; ";
    }
    const std::string strState = m_store.state();
    if (!allows(strState)) {
        strWrong += "a third state: " + strState.substr(0, 200) + "; ";
    } else if (blDone && !isDone(strState)) {
        strWrong += "reported success, yet the store is: " + strState.substr(0, 200) + "; ";
    }
    return strWrong.empty() ? "" : strWrong + "log: " + std::string(Log::text()).substr(0, 2000);
}

int64_t failEach(const TokenStore& store, const Operation& operation, Injection& injection)
{
    SCOPED_TRACE(operation.szName);
    const Oracle oracle(store, operation);
    const auto judge = [&](int64_t nFirst, int64_t nLast) {
        std::string strWrong;
        injection.nFirst = nFirst;
        injection.nLast = nLast;
        injection.nCalls = 0;
        injection.run([&] {
            strWrong = oracle.judge([&] { injection.blRunning = true; }, [&] { injection.blRunning = false; },
                                    injection.uidAfter);
        });
        EXPECT_EQ("", strWrong) << "call " << nFirst << " to " << nLast;
    };
    judge(0, -1);
    const int64_t nCalls = injection.nCalls;
    for (int64_t nCall = 1; nCall <= nCalls; ++nCall) {
        judge(nCall, nCall);
        judge(nCall, INT64_MAX);
    }
    judge(0, -1);
    return nCalls;
}

void failEachOfAll(Injection& injection)
{
    const TokenStore store;
    int64_t nCalls = 0;
    for (const Operation& operation : operations()) {
        nCalls += failEach(store, operation, injection);
    }
    EXPECT_LT(0, nCalls);
}
