#include "Metrics.h"

#include <cstdio>

namespace {

// One family of metrics.
class Family {
public:
    Family(std::string& strOut, const char* szName, const char* szType, const char* szHelp)
        : m_strOut(strOut), m_szName(szName)
    {
        m_strOut.append("# HELP ").append(szName).append(" ").append(szHelp).append("\n# TYPE ");
        m_strOut.append(szName).append(" ").append(szType).append("\n");
    }
    template <typename Number>
    Family& add(const std::string& strLabels, Number number, const char* szSuffix = "")
    {
        m_strOut.append(m_szName).append(szSuffix);
        m_strOut.append(strLabels.empty() ? "" : "{" + strLabels + "}");
        m_strOut.append(" ").append(std::to_string(number)).append("\n");
        return *this;
    }

private:
    std::string& m_strOut;
    const char* const m_szName;
};

double seconds(uint64_t nNanoseconds)
{
    return static_cast<double>(nNanoseconds) / 1e9;
}

const struct {
    gate::Figure figure;
    const char* szOutcome;
} OUTCOMES[] = {
    {gate::GRANTED, "granted"},
    {gate::REFUSED_UNKNOWN, "unknown"},
    {gate::REFUSED_EXPIRED, "expired"},
    {gate::REFUSED_API, "api_not_listed"},
    {gate::REFUSED_METHOD, "method_not_listed"},
    {gate::REFUSED_MALFORMED, "malformed"},
    {gate::REFUSED_OWNER, "owner_unknown"},
    {gate::REFUSED_LARGE, "too_large"},
    {gate::FAILED, "failed"},
    {gate::LATE, "late"},
    {gate::CANCELLED, "cancelled"},
};

const struct {
    gate::Figure figure;
    const char* szLimit;
} SIZES[] = {
    {gate::BATCH_LE_1, "1"},   {gate::BATCH_LE_4, "4"},     {gate::BATCH_LE_16, "16"},
    {gate::BATCH_LE_64, "64"}, {gate::BATCH_LE_256, "256"},
};

} // namespace

namespace gate {

void Metrics::count(int nStatus, int64_t nTook)
{
    ++m_nResponses[nStatus];
    size_t nBucket = 0;
    for (int64_t nLimit = 125000; nLimit < nTook && nBucket < BUCKETS; nLimit *= 2) {
        ++nBucket;
    }
    ++m_rgTook[nBucket];
    m_nTookSum += static_cast<uint64_t>(nTook);
}

std::string Metrics::text(const Figures& figures, size_t nConnections) const
{
    std::string strText;
    Family responses(strText, "vemo_gate_responses_total", "counter", "Responses by status.");
    for (const auto& [nStatus, nNumber] : m_nResponses) {
        responses.add("status=\"" + std::to_string(nStatus) + "\"", nNumber);
    }
    Family calls(strText, "vemo_gate_calls_total", "counter", "Calls by outcome.");
    for (const auto& outcome : OUTCOMES) {
        calls.add(std::string("outcome=\"") + outcome.szOutcome + "\"", figures[outcome.figure]);
    }
    Family took(strText, "vemo_gate_response_seconds", "histogram",
                "Time from a whole head to its response.");
    uint64_t nUpTo = 0;
    int64_t nLimit = 125000;
    for (size_t nBucket = 0; nBucket < BUCKETS; ++nBucket, nLimit *= 2) {
        nUpTo += m_rgTook[nBucket];
        char szLimit[32];
        snprintf(szLimit, sizeof(szLimit), "le=\"%g\"", static_cast<double>(nLimit) / 1e9);
        took.add(szLimit, nUpTo, "_bucket");
    }
    nUpTo += m_rgTook[BUCKETS];
    took.add("le=\"+Inf\"", nUpTo, "_bucket").add("", seconds(m_nTookSum), "_sum").add("", nUpTo, "_count");
    Family sizes(strText, "vemo_gate_batch_size", "histogram", "Calls in one transaction.");
    nUpTo = 0;
    for (const auto& size : SIZES) {
        nUpTo += figures[size.figure];
        sizes.add(std::string("le=\"") + size.szLimit + "\"", nUpTo, "_bucket");
    }
    uint64_t nCalls = 0;
    for (size_t nFigure = GRANTED; nFigure <= REFUSED_LARGE; ++nFigure) {
        nCalls += figures[nFigure];
    }
    sizes.add("le=\"+Inf\"", figures[BATCHES], "_bucket")
        .add("", nCalls, "_sum")
        .add("", figures[BATCHES], "_count");
    Family(strText, "vemo_gate_batches_failed_total", "counter", "Transactions that were undone.")
        .add("", figures[BATCHES_FAILED]);
    Family(strText, "vemo_gate_wait_seconds_total", "counter",
           "Time that the locks of other programs have taken.")
        .add("", seconds(figures[WAIT_NS]));
    Family(strText, "vemo_gate_commit_seconds_total", "counter", "Time that commits have taken.")
        .add("", seconds(figures[COMMIT_NS]));
    Family(strText, "vemo_gate_purged_total", "counter", "Expired tokens that were deleted.")
        .add("", figures[PURGED]);
    Family(strText, "vemo_gate_repeated_total", "counter", "Calls that were answered as repetitions.")
        .add("", m_nRepeated);
    Family(strText, "vemo_gate_turned_away_total", "counter",
           "Connections closed because there were too many.")
        .add("", m_nTurnedAway);
    Family(strText, "vemo_gate_connections", "gauge", "Connections that are open.").add("", nConnections);
    Family(strText, "vemo_gate_store_bytes", "gauge", "Size of the token database.")
        .add("", figures[STORE_BYTES]);
    return strText;
}

} // namespace gate
