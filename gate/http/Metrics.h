// The counts of the process that reads HTTP, and the text of all figures for Prometheus.

#ifndef GATE_HTTP_METRICS_H
#define GATE_HTTP_METRICS_H

#include <array>
#include <cstdint>
#include <map>
#include <string>

#include "gate/Messages.h"

namespace gate {

class Metrics {
public:
    // Counts a response, and its time since the complete head, in ns.
    void count(int nStatus, int64_t nTook);
    void countRepeated() { ++m_nRepeated; }
    void countTurnedAway() { ++m_nTurnedAway; }

    // figures are those of the process that holds the tokens. nConnections are open now.
    std::string text(const Figures& figures, size_t nConnections) const;

private:
    static constexpr size_t BUCKETS = 12; // the first ends at 0.125 ms, each other at twice the time

    std::map<int, uint64_t> m_nResponses; // by status
    std::array<uint64_t, BUCKETS + 1> m_rgTook = {};
    uint64_t m_nTookSum = 0; // ns
    uint64_t m_nRepeated = 0;
    uint64_t m_nTurnedAway = 0;
};

} // namespace gate

#endif
