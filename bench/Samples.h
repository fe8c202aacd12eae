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
    double percentile(size_t nPercent)
    {
        std::sort(m_rgdSample.begin(), m_rgdSample.end());
        return m_rgdSample[std::min(m_rgdSample.size() * nPercent / 100, m_rgdSample.size() - 1)];
    }

    double median() { return percentile(50); }

private:
    std::vector<double> m_rgdSample;
};

#endif
