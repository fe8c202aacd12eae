#include "Masking.h"

#include "AccessTokenDefine.h"

namespace {

// The text, unless it is as long as an id.
std::string unlessId(const std::string& strText)
{
    return strText.size() < VEMO_ATOKEN_LENGTH_MIN ? strText : tool::shortened(strText);
}

} // namespace

namespace tool {

std::string masked(const std::string& strTid)
{
    size_t nCharacters = 0;
    for (size_t i = 0; i < strTid.size(); ++i) {
        const bool blContinued = (static_cast<unsigned char>(strTid[i]) & 0xc0) == 0x80; // UTF-8
        if (!blContinued && ++nCharacters > PREFIX_MIN) {
            return strTid.substr(0, i);
        }
    }
    return strTid;
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
    std::string strShown;
    for (size_t nStart = 0;;) {
        const size_t nEnd = strPath.find('/', nStart);
        strShown += unlessId(strPath.substr(nStart, nEnd - nStart));
        if (std::string::npos == nEnd) {
            return strShown;
        }
        strShown += '/';
        nStart = nEnd + 1;
    }
}

} // namespace tool
