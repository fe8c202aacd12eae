#include "Visible.h"

#include <langinfo.h>
#include <locale.h>
#include <wchar.h>
#include <wctype.h>

#include <algorithm>
#include <cstddef>
#include <cstdio>
#include <cstring>
#include <iterator>
#include <string_view>

namespace {

const wchar_t INVALID = -1; // stands for a byte that is not valid UTF-8

struct Range {
    wchar_t cFirst;
    wchar_t cLast;
};

// Characters that the C library calls printable, but that cannot be seen. By Unicode: the categories Cf
// (format), Zs (blanks) and Co (private use, which can look like anything), and those ignored by default.
const Range INVISIBLE[] = {
    {0x00a0, 0x00a0},    // no-break space
    {0x00ad, 0x00ad},    // soft hyphen
    {0x034f, 0x034f},    // combining grapheme joiner
    {0x0600, 0x0605},    // Arabic number signs
    {0x061c, 0x061c},    // Arabic letter mark, which sets the direction
    {0x06dd, 0x06dd},    // Arabic end of ayah
    {0x070f, 0x070f},    // Syriac abbreviation mark
    {0x0890, 0x0891},    // Arabic currency marks
    {0x08e2, 0x08e2},    // Arabic disputed end of ayah
    {0x115f, 0x1160},    // Hangul fillers
    {0x1680, 0x1680},    // Ogham space
    {0x17b4, 0x17b5},    // Khmer inherent vowels
    {0x180b, 0x180f},    // Mongolian variation selectors and vowel separator
    {0x2000, 0x200f},    // blanks, zero-width characters and direction marks
    {0x2028, 0x202f},    // separators, embeddings and overrides of direction
    {0x205f, 0x206f},    // invisible operators, isolates of direction
    {0x2800, 0x2800},    // Braille pattern without dots
    {0x3000, 0x3000},    // ideographic space
    {0x3164, 0x3164},    // Hangul filler
    {0xe000, 0xf8ff},    // private use
    {0xfe00, 0xfe0f},    // variation selectors
    {0xfeff, 0xfeff},    // zero-width no-break space, the byte order mark
    {0xffa0, 0xffa0},    // half-width Hangul filler
    {0xfff0, 0xfffb},    // interlinear annotation
    {0x110bd, 0x110bd},  // Kaithi number sign
    {0x110cd, 0x110cd},  // Kaithi number sign above
    {0x13430, 0x1343f},  // Egyptian hieroglyph format controls
    {0x1bca0, 0x1bca3},  // shorthand format controls
    {0x1d173, 0x1d17a},  // musical format controls
    {0xe0000, 0xe0fff},  // tags and variation selectors
    {0xf0000, 0x10ffff}, // private use
};

locale_t utf8()
{
    static const locale_t locale = newlocale(LC_CTYPE_MASK, "C.UTF-8", nullptr);
    return locale;
}

bool isAscii(wchar_t cWide)
{
    return static_cast<unsigned int>(cWide) < 0x80;
}

// Needs the locale that rewritten() sets.
bool isVisible(wchar_t cWide)
{
    const auto holds = [cWide](const Range& range) { return range.cFirst <= cWide && cWide <= range.cLast; };
    return iswprint(static_cast<wint_t>(cWide)) && // false for INVALID
           std::none_of(std::begin(INVISIBLE), std::end(INVISIBLE), holds);
}

bool isShown(wchar_t cWide, tool::Charset charset)
{
    return isAscii(cWide) || tool::Charset::Utf8 == charset;
}

// Whether a character is always written as it is. A backslash is not, because it can begin an escape.
bool isPlain(char c)
{
    return ' ' <= c && c <= '~' && c != '\\';
}

// Replaces each character of a text by what write() makes of it; write() gets the character and its bytes. If
// the machine has no UTF-8 locale, or no memory for it, only ASCII is valid.
template <typename Write>
std::string rewritten(const std::string& strText, Write write)
{
    const locale_t before = uselocale(utf8());
    std::string strOut;
    const char* szRest = strText.data();
    const char* const szEnd = szRest + strText.size();
    for (;;) {
        // Copying plain text in one go is several times as fast.
        const char* const szOdd = std::find_if_not(szRest, szEnd, isPlain);
        strOut.append(szRest, szOdd);
        if (szOdd == szEnd) {
            break;
        }
        const size_t cbOdd = static_cast<size_t>(szEnd - szOdd);
        wchar_t cWide = L'\0';
        mbstate_t state = {};
        const size_t cbRead = mbrtowc(&cWide, szOdd, cbOdd, &state); // 0 for a NUL
        // mbrtowc() returns numbers above any valid length for errors. UTF-8 ends at 0x10ffff.
        const bool blValid = cbRead <= cbOdd && (isAscii(cWide) || (utf8() && cWide <= 0x10ffff));
        const size_t cbCharacter = blValid && cbRead ? cbRead : 1;
        write(strOut, std::string_view(szOdd, cbCharacter), blValid ? cWide : INVALID);
        szRest = szOdd + cbCharacter;
    }
    uselocale(before);
    return strOut;
}

void appendBytes(std::string& strOut, std::string_view strBytes)
{
    for (const char c : strBytes) {
        char szEscape[5];
        snprintf(szEscape, sizeof(szEscape), "\\x%02x", static_cast<unsigned char>(c));
        strOut += szEscape;
    }
}

void appendUnit(std::string& strOut, unsigned int nUnit)
{
    char szEscape[7];
    snprintf(szEscape, sizeof(szEscape), "\\u%04x", nUnit & 0xffff);
    strOut += szEscape;
}

// Appends a character as JSON escapes it, in UTF-16.
void appendUnits(std::string& strOut, wchar_t cWide)
{
    const unsigned int nCharacter = static_cast<unsigned int>(cWide);
    if (nCharacter < 0x10000) {
        appendUnit(strOut, nCharacter);
    } else {
        appendUnit(strOut, 0xd800 + ((nCharacter - 0x10000) >> 10));
        appendUnit(strOut, 0xdc00 + (nCharacter & 0x3ff));
    }
}

} // namespace

namespace tool {

Charset localeCharset()
{
    return 0 == strcmp(nl_langinfo(CODESET), "UTF-8") ? Charset::Utf8 : Charset::Ascii;
}

std::string printable(const std::string& strText, Charset charset)
{
    return rewritten(strText, [charset](std::string& strOut, std::string_view strBytes, wchar_t cWide) {
        const bool blLikeEscape = '\\' == cWide && 'x' == strBytes.data()[1]; // a NUL at the end
        if (isVisible(cWide) && isShown(cWide, charset) && !blLikeEscape) {
            strOut += strBytes;
        } else {
            appendBytes(strOut, strBytes);
        }
    });
}

std::string validUtf8(const std::string& strText)
{
    return rewritten(strText, [](std::string& strOut, std::string_view strBytes, wchar_t cWide) {
        if (INVALID != cWide) {
            strOut += strBytes;
        } else {
            appendBytes(strOut, strBytes);
        }
    });
}

std::string visibleJson(const std::string& strJson)
{
    return rewritten(strJson, [](std::string& strOut, std::string_view strBytes, wchar_t cWide) {
        if (isVisible(cWide) || INVALID == cWide || '\n' == cWide) { // the line breaks of styled JSON
            strOut += strBytes;
        } else {
            appendUnits(strOut, cWide);
        }
    });
}

std::string showableJson(const std::string& strJson, Charset charset)
{
    return rewritten(strJson, [charset](std::string& strOut, std::string_view strBytes, wchar_t cWide) {
        if (INVALID == cWide) {
            appendUnit(strOut, 0xdc00U + static_cast<unsigned char>(strBytes[0]));
        } else if (isShown(cWide, charset)) {
            strOut += strBytes;
        } else {
            appendUnits(strOut, cWide);
        }
    });
}

} // namespace tool
