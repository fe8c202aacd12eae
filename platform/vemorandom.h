// Stand-in for the platform's random library: what the token library uses of it.

#ifndef VEMORANDOM_H
#define VEMORANDOM_H

#include <cstddef>
#include <string>

namespace VEMO {
namespace RANDOM {

// Random numbers and strings from any source of random bytes. All results are equally likely.
class VEMORandomBase {
public:
    virtual ~VEMORandomBase() = default;

    // Returns a number from nMin to nMax, both included, 0 <= nMin <= nMax; or -1 with errno set when
    // the source fails or the bounds are wrong.
    int random(int nMin, int nMax);

    // Sets strOut to cchLength characters of strAlphabet, which has 1 to 256 characters. Returns 0; or -1
    // with errno set, and leaves strOut unchanged.
    int getString(const std::string& strAlphabet, unsigned int cchLength, std::string& strOut);

protected:
    // Fills a buffer with random bytes. Returns false, with errno set, on failure.
    virtual bool fill(void* pBuffer, size_t cbBuffer) = 0;
};

// The kernel's random source. One thread at a time may use an object.
class VEMORandom : public VEMORandomBase {
protected:
    bool fill(void* pBuffer, size_t cbBuffer) override;
};

} // namespace RANDOM
} // namespace VEMO

#endif
