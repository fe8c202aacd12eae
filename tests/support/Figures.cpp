#include "Figures.h"

#include <cstdio>
#include <cstdlib>

namespace {

uint64_t numberOf(const char* szVariable)
{
    const char* szValue = getenv(szVariable);
    return szValue ? strtoull(szValue, nullptr, 10) : 1;
}

} // namespace

int64_t scaled(int64_t nEveryday)
{
    return nEveryday * static_cast<int64_t>(numberOf("VEMO_TEST_FACTOR"));
}

uint64_t seed()
{
    return numberOf("VEMO_TEST_SEED");
}

void figure(const std::string& strName, const std::string& strText)
{
    fprintf(stdout, "figure: %s: %s\n", strName.c_str(), strText.c_str());
    fflush(stdout);
}

std::string share(int64_t nPart, int64_t nWhole)
{
    if (0 == nWhole) {
        return "none";
    }
    char szShare[32];
    snprintf(szShare, sizeof(szShare), "%.1f %%",
             100.0 * static_cast<double>(nPart) / static_cast<double>(nWhole));
    return szShare;
}
