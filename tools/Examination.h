// What can be wrong with the place of the database and with what it holds.

#ifndef TOOLS_EXAMINATION_H
#define TOOLS_EXAMINATION_H

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace tool {

struct Finding {
    enum class Severity {
        Error,   // makes calls fail, or do something else than they report
        Warning, // can do so
        Note,    // is worth knowing, and nothing wrong
    };

    Severity severity;
    std::string strWhat;
    std::string strMeaning;
    std::string strRemedy;
    std::function<void()> repair; // empty where an administrator must decide; throws Failure
};

typedef std::vector<Finding> Findings;

// Whether there are none but notes.
bool areNotes(const Findings& findings);

// What helps where a database cannot stay. Its journals belong to it, so it goes with its directory.
extern const char* const REMEDY_REPLACE;
extern const char* const REMEDY_SAVE_AND_REPLACE;

// The tokens that a finding is about: how many, and the names of the first.
class TokenNames {
public:
    void add(const std::optional<std::string>& strTid);
    uint64_t count() const { return m_nTokens; }
    std::string text() const; // "7 tokens (Ab12Cd34, ...)"

private:
    uint64_t m_nTokens = 0;
    std::string m_strNames;
};

// Everything that is wrong now. What cannot be looked at because of one finding is left out.
Findings examine();

// Its parts, which add to the findings. The first returns whether the database can be opened.
bool examinePlace(Findings& findings);
void examineStore(Findings& findings);

// Parts of the place: whether a directory or a file can be written to, and the rest of what keeps programs
// from writing.
void examineWritability(const std::string& strPath, Findings& findings);
void examineFileSystem(Findings& findings);

// Parts of the store: the table and what belongs to it, and the tokens. The first returns whether the tokens
// can be read; the second repairs only those of a sound table.
bool examineSchema(Findings& findings);
void examineTokens(bool blTableSound, Findings& findings);

// Notes about the tokens.
void examineUse(Findings& findings);

} // namespace tool

#endif
