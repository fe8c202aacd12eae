// What of a text can be seen, and how the rest is written.
//
// The rest could command a terminal, change the order of what it shows, or make two texts look alike that
// are not: control characters, those that only format, all blanks but the plain one, and others without a
// look of their own. Letters of all scripts can be seen, and so can the marks on them.

#ifndef TOOLS_VISIBLE_H
#define TOOLS_VISIBLE_H

#include <string>

namespace tool {

// What the reader of a text can show.
enum class Charset { Utf8, Ascii };

// What the locale says of that.
Charset localeCharset();

// Text for people: \xNN for each byte of what cannot be seen or shown, and of what is no UTF-8. A backslash
// that would begin such a group is \x5c.
std::string printable(const std::string& strText, Charset charset = Charset::Utf8);

// The same for what is no UTF-8 alone.
std::string validUtf8(const std::string& strText);

// The same JSON with \uNNNN for what cannot be seen. What is no UTF-8 stays.
std::string visibleJson(const std::string& strJson);

// For a terminal, \uNNNN for what it cannot show of such JSON, and \udcNN for a byte that is no UTF-8.
std::string showableJson(const std::string& strJson, Charset charset);

} // namespace tool

#endif
