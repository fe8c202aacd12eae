#include "vemorandom.h"

#include <sys/random.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <limits>

namespace VEMO {
namespace RANDOM {

namespace {

int failInvalid()
{
    errno = EINVAL;
    return -1;
}

} // namespace

int VEMORandomBase::random(int nMin, int nMax)
{
    if (0 > nMin || nMin > nMax) {
        return failInvalid();
    }
    // The range of a draw need not be a multiple of nChoices. A draw above the last multiple is made again:
    // it would make the lowest numbers more likely.
    const uint64_t nChoices = static_cast<uint64_t>(nMax - nMin) + 1;
    const uint64_t nLimit = std::numeric_limits<uint64_t>::max() / nChoices * nChoices;
    uint64_t nDraw = 0;
    do {
        if (!fill(&nDraw, sizeof(nDraw))) {
            return -1;
        }
    } while (nDraw >= nLimit);
    return nMin + static_cast<int>(nDraw % nChoices);
}

int VEMORandomBase::getString(const std::string& strAlphabet, unsigned int cchLength, std::string& strOut)
{
    if (strAlphabet.empty() || 256 < strAlphabet.size()) {
        return failInvalid();
    }
    const unsigned int nChoices = static_cast<unsigned int>(strAlphabet.size());
    const unsigned int nLimit = 256 / nChoices * nChoices; // as in random(); a draw is one byte here
    std::string strResult;
    strResult.reserve(cchLength);
    unsigned char rgDraw[256];
    while (strResult.size() < cchLength) {
        const size_t cbDraw = std::min(sizeof(rgDraw), cchLength - strResult.size());
        if (!fill(rgDraw, cbDraw)) {
            return -1;
        }
        for (size_t i = 0; i < cbDraw; ++i) {
            if (rgDraw[i] < nLimit) {
                strResult += strAlphabet[rgDraw[i] % nChoices];
            }
        }
    }
    strOut.swap(strResult);
    return 0;
}

bool VEMORandom::fill(void* pBuffer, size_t cbBuffer)
{
    unsigned char* pNext = static_cast<unsigned char*>(pBuffer);
    while (0 < cbBuffer) {
        const ssize_t cbGot = getrandom(pNext, cbBuffer, 0);
        if (0 > cbGot) {
            if (EINTR == errno) {
                continue;
            }
            return false;
        }
        pNext += cbGot;
        cbBuffer -= static_cast<size_t>(cbGot);
    }
    return true;
}

} // namespace RANDOM
} // namespace VEMO
