// Stand-in for the platform's random library: what the token library uses of it.

#ifndef VEMORANDOM_H
#define VEMORANDOM_H

#include <cstddef>
#include <string>

namespace VEMO {
namespace RANDOM {

// Random numbers and strings from any source of random bytes; every outcome equally likely.
class VEMORandomBase {
public:
    virtual ~VEMORandomBase() = default;

    // A number from nMin to nMax, both included, 0 <= nMin <= nMax. Returns -1 with errno set when
    // the source fails or the bounds are wrong.
    int random(int nMin, int nMax);

    // Sets strOut to cchLength characters of strAlphabet (1 to 256 characters, each as likely as it
    // is frequent there). Returns 0; or -1 with errno set, when strOut is as it was.
    int getString(const std::string& strAlphabet, unsigned int cchLength, std::string& strOut);

protected:
    // Fills a buffer with random bytes. Returns false, with errno set, when there are none.
    virtual bool fill(void* pBuffer, size_t cbBuffer) = 0;
};

// The kernel's random source. Objects share nothing and may be used by one thread each.
class VEMORandom : public VEMORandomBase {
protected:
    bool fill(void* pBuffer, size_t cbBuffer) override;
};

} // namespace RANDOM
} // namespace VEMO

#endif
