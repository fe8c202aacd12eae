// What the process that reads HTTP counts, and all that is counted as text for Prometheus.

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
    // A response that went out, and how long after the whole head had come, in ns.
    void count(int nStatus, int64_t nTook);
    void countRepeated() { ++m_nRepeated; }
    void countTurnedAway() { ++m_nTurnedAway; }

    // figures: those of the process that holds the tokens. nConnections: open now.
    std::string text(const Figures& figures, size_t nConnections) const;

private:
    static constexpr size_t BUCKETS = 12; // from 0.125 ms on, each twice as long

    std::map<int, uint64_t> m_nResponses; // by status
    std::array<uint64_t, BUCKETS + 1> m_rgTook = {};
    uint64_t m_nTookSum = 0; // ns
    uint64_t m_nRepeated = 0;
    uint64_t m_nTurnedAway = 0;
};

} // namespace gate

#endif
