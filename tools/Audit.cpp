#include "Audit.h"

#include <syslog.h>
#include <unistd.h>

#include <charconv>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <new>
#include <optional>

#include "AccessTokenDefine.h"
#include "Masking.h"
#include "Values.h"
#include "Visible.h"

namespace {

struct Note {
    const char* szDone;
    uint64_t nTokens;
    std::vector<std::string> strPrefixes;
};

std::string g_strCommand;
std::vector<Note> g_notes;     // of the change under way
std::vector<Note> g_notesMade; // of committed changes
bool g_blMade = false;
bool g_blPerhaps = false;

// The first characters of an id; only "..." for an id that has no more.
std::string prefixOf(const std::string& strTid)
{
    const bool blWhole = tool::masked(strTid).size() == strTid.size();
    return blWhole ? "..." : tool::printable(tool::shortened(strTid));
}

Note& noteOf(const char* szDone)
{
    for (Note& note : g_notes) {
        if (0 == strcmp(note.szDone, szDone)) {
            return note;
        }
    }
    g_notes.push_back({szDone, 0, {}});
    return g_notes.back();
}

std::string textOf(const Note& note)
{
    std::string strText = tool::countText(note.nTokens, "token") + " " + note.szDone;
    if (note.nTokens != note.strPrefixes.size()) {
        return strText;
    }
    const char* szBefore = " (";
    for (const std::string& strPrefix : note.strPrefixes) {
        strText += szBefore + strPrefix;
        szBefore = ", ";
    }
    return strText + ")";
}

// The committed changes in words.
std::string changeText()
{
    std::string strText;
    for (const Note& note : g_notesMade) {
        strText += (strText.empty() ? "" : ", ") + textOf(note);
    }
    return (g_blPerhaps ? "perhaps " : "") + (strText.empty() ? "the store was changed" : strText);
}

// The uid in a text. Nothing for any other text, and for the number that stands for no user.
std::optional<uid_t> uidOf(const char* szText)
{
    uid_t uid = UID_ERR;
    const char* const szEnd = szText + strlen(szText);
    const auto [szRest, error] = std::from_chars(szText, szEnd, uid);
    return std::errc() == error && szRest == szEnd && UID_ERR != uid ? std::optional<uid_t>(uid)
                                                                     : std::nullopt;
}

// Who called the tool. The caller, root already, may have set SUDO_UID; the login uid is the kernel's.
std::string callerText()
{
    const char* const szSudo = getenv("SUDO_UID");
    const std::optional<uid_t> sudo = szSudo ? uidOf(szSudo) : std::nullopt;
    std::string strLogin;
    std::getline(std::ifstream("/proc/self/loginuid"), strLogin);
    const std::optional<uid_t> login = uidOf(strLogin.c_str());
    return "by uid " + (sudo ? std::to_string(*sudo) + " (sudo)" : std::to_string(getuid())) +
           (login ? ", login uid " + std::to_string(*login) : ", no login uid");
}

void write(const char* szText)
{
    openlog("vemo-access-token", 0, LOG_USER); // also if the program was called by another name
    syslog(LOG_AUTHPRIV | LOG_NOTICE, "%s", szText);
}

} // namespace

namespace tool {
namespace audit {

void setCommand(const std::string& strCommand)
{
    g_strCommand = strCommand;
}

void note(const char* szDone, const std::string& strTid)
{
    note(szDone, std::vector<std::string>{strTid}, 1);
}

void note(const char* szDone, const std::vector<std::string>& strTids, uint64_t nTokens)
{
    if (0 == nTokens) {
        return;
    }
    Note& changed = noteOf(szDone);
    changed.nTokens += nTokens;
    for (const std::string& strTid : strTids) {
        if (changed.strPrefixes.size() < PREFIXES_MAX) {
            changed.strPrefixes.push_back(prefixOf(strTid));
        }
    }
}

bool hasNotes()
{
    return !g_notes.empty();
}

void made(Certainty certainty)
{
    g_blMade = true;
    g_blPerhaps = Certainty::Perhaps == certainty;
    if (!g_notes.empty()) {
        g_notesMade.swap(g_notes);
        g_notes.clear();
    }
}

void tell()
{
    g_notes.clear();
    if (!g_blMade) {
        return;
    }
    try {
        write((g_strCommand + ": " + changeText() + "; " + callerText()).c_str());
    } catch (const std::bad_alloc&) {
        write("the store was changed, and there is no memory to tell more");
    }
    g_notesMade.clear();
    g_blMade = g_blPerhaps = false;
}

} // namespace audit
} // namespace tool
