// What can be wrong with the place of the database and with what it holds.

#ifndef TOOLS_EXAMINATION_H
#define TOOLS_EXAMINATION_H

#include <functional>
#include <string>
#include <vector>

namespace tool {

struct Finding {
    enum class Severity { Error, Warning };

    Severity severity;
    std::string strWhat;
    std::string strMeaning;
    std::string strRemedy;
    std::function<void()> repair; // empty where an administrator must decide; throws Failure
};

typedef std::vector<Finding> Findings;

// What helps where a database cannot stay. Its journals belong to it, so it goes with its directory.
extern const char* const REMEDY_REPLACE;
extern const char* const REMEDY_SAVE_AND_REPLACE;

// Everything that is wrong now. What cannot be looked at because of one finding is left out.
Findings examine();

// Its parts, which add to the findings. The first returns whether the database can be opened.
bool examinePlace(Findings& findings);
void examineStore(Findings& findings);

// Parts of the place: whether a directory or a file can be written to, and the rest of what keeps programs
// from writing.
void examineWritability(const std::string& strPath, Findings& findings);
void examineFileSystem(Findings& findings);

} // namespace tool

#endif
