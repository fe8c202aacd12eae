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

// Everything that is wrong now. What cannot be looked at because of one finding is left out.
std::vector<Finding> examine();

} // namespace tool

#endif
