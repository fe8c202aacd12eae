// Looks for everything that can be wrong with the directory and file of the database, and with its contents.

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
        Error,   // calls fail, or do not do what they report
        Warning, // calls may fail, or not do what they report
        Note,    // worth knowing, but nothing is wrong
    };

    Severity severity;
    std::string strWhat;
    std::string strMeaning;
    std::string strRemedy;
    std::function<void()> repair; // empty if an administrator must decide; throws Failure
};

typedef std::vector<Finding> Findings;

// Whether all findings are notes.
bool areNotes(const Findings& findings);

// Remedies for a database that cannot stay. The whole directory is replaced, because the journals belong to
// the database.
extern const char* const REMEDY_REPLACE;
extern const char* const REMEDY_SAVE_AND_REPLACE;

// The tokens that a finding is about: their number, and the first characters of some ids.
class TokenNames {
public:
    void add(const std::optional<std::string>& strTid);
    uint64_t count() const { return m_nTokens; }
    std::string text() const; // "7 tokens (Ab12Cd34, ...)"

private:
    uint64_t m_nTokens = 0;
    std::string m_strNames;
};

// Finds everything that is wrong now. Leaves out what cannot be examined because of another finding.
Findings examine();

// The two parts of examine(). They add to the findings. The first returns whether the database can be opened.
bool examinePlace(Findings& findings);
void examineStore(Findings& findings);

// Parts of examinePlace(): whether one directory or file can be written to; whether the file system, the
// database file and the free space let programs write.
void examineWritability(const std::string& strPath, Findings& findings);
void examineFileSystem(Findings& findings);

// Parts of examineStore(): the table, with its indexes and triggers, and the tokens. The first returns
// whether the tokens can be read. The second offers repairs only if the table is sound.
bool examineSchema(Findings& findings);
void examineTokens(bool blTableSound, Findings& findings);

// Adds notes about the tokens.
void examineUse(Findings& findings);

} // namespace tool

#endif
