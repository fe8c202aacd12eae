#include "Masking.h"

#include "AccessTokenDefine.h"

namespace {

const size_t CHARACTER_MAX = 4; // bytes of a character in UTF-8

bool isLikeId(const std::string& strText)
{
    return strText.size() >= VEMO_ATOKEN_LENGTH_MIN;
}

// The text, shortened if it is as long as an id.
std::string unlessId(const std::string& strText)
{
    return isLikeId(strText) ? tool::shortened(strText) : strText;
}

// The path, with show() applied to each of its parts.
template <typename Show>
std::string withParts(const std::string& strPath, Show show)
{
    std::string strShown;
    for (size_t nStart = 0;;) {
        const size_t nEnd = strPath.find('/', nStart);
        strShown += show(strPath.substr(nStart, nEnd - nStart));
        if (std::string::npos == nEnd) {
            return strShown;
        }
        strShown += '/';
        nStart = nEnd + 1;
    }
}

} // namespace

namespace tool {

std::string masked(const std::string& strTid)
{
    size_t nCharacters = 0;
    size_t cbMasked = 0;
    for (const char c : strTid) {
        const bool blContinued = (static_cast<unsigned char>(c) & 0xc0) == 0x80; // UTF-8
        const bool blEnough = !blContinued && ++nCharacters > PREFIX_MIN;
        if (blEnough || cbMasked == PREFIX_MIN * CHARACTER_MAX) { // stray UTF-8 bytes are not characters
            break;
        }
        ++cbMasked;
    }
    return strTid.substr(0, cbMasked);
}

std::string shortened(const std::string& strTid)
{
    const std::string strMasked = masked(strTid);
    return strMasked + (strMasked.size() < strTid.size() ? "..." : "");
}

std::string quoted(const std::string& strText)
{
    return "\"" + unlessId(strText) + "\"";
}

std::string shownPath(const std::string& strPath)
{
    const std::string strShown = withParts(strPath, unlessId);
    // An id that contains slashes, as Base64 can, is split into parts too short to look like an id.
    return isLikeId(strShown) ? unlessId(withParts(strPath, shortened)) : strShown;
}

std::string shownReason(const std::string& strReason)
{
    const size_t nStart = strReason.find_first_of("'\"(") + 1;
    const size_t nEnd = strReason.find_last_of("'\")");
    if (0 == nStart || std::string::npos == nEnd || nEnd < nStart) {
        return unlessId(strReason);
    }
    return unlessId(strReason.substr(0, nStart)) + unlessId(strReason.substr(nStart, nEnd - nStart)) +
           unlessId(strReason.substr(nEnd));
}

} // namespace tool
