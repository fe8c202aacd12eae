// Finds invisible characters, and escapes them.
//
// Invisible characters could control a terminal, change the order of its text, or make two different texts
// look the same. These are control and format characters, all blanks but the plain one, and other characters
// that show nothing. Letters of all scripts, and the marks on them, are visible.

#ifndef TOOLS_VISIBLE_H
#define TOOLS_VISIBLE_H

#include <string>

namespace tool {

// The characters that the reader of a text can show.
enum class Charset { Utf8, Ascii };

// The character set of the locale.
Charset localeCharset();

// Text for people: each byte of a character that is invisible or that the charset lacks, and each byte that
// is not valid UTF-8, becomes \xNN. A backslash that would look like such an escape becomes \x5c.
std::string printable(const std::string& strText, Charset charset = Charset::Utf8);

// The text with \xNN for each byte that is not valid UTF-8; everything else stays.
std::string validUtf8(const std::string& strText);

// The same JSON with \uNNNN for invisible characters. Bytes that are not valid UTF-8 stay.
std::string visibleJson(const std::string& strJson);

// Such JSON for a terminal: \uNNNN for each character that the terminal cannot show, and \udcNN for each byte
// that is not valid UTF-8.
std::string showableJson(const std::string& strJson, Charset charset);

} // namespace tool

#endif
