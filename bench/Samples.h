// Measurements of single calls.

#ifndef VEMO_ACCESS_TOKEN_BENCH_SAMPLES_H
#define VEMO_ACCESS_TOKEN_BENCH_SAMPLES_H

#include <algorithm>
#include <chrono>
#include <cstddef>
#include <vector>

class Samples {
public:
    void add(double dSample) { m_rgdSample.push_back(dSample); }

    // Adds the microseconds that the call takes, and returns them.
    template <typename Call>
    double time(Call call)
    {
        const auto start = std::chrono::steady_clock::now();
        call();
        add(std::chrono::duration<double, std::micro>(std::chrono::steady_clock::now() - start).count());
        return m_rgdSample.back();
    }

    // The value that nPercent of the samples do not exceed. There must be samples.
    double percentile(int nPercent)
    {
        const size_t nRank = m_rgdSample.size() * static_cast<size_t>(nPercent) / 100;
        const auto it =
            m_rgdSample.begin() + static_cast<std::ptrdiff_t>(std::min(nRank, m_rgdSample.size() - 1));
        std::nth_element(m_rgdSample.begin(), it, m_rgdSample.end());
        return *it;
    }

    double median() { return percentile(50); }

private:
    std::vector<double> m_rgdSample;
};

#endif
