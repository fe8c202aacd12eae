// Options and arguments that several commands share.

#ifndef TOOLS_ARGUMENTS_H
#define TOOLS_ARGUMENTS_H

#include <json/value.h>

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "Commands.h"
#include "Failure.h"
#include "Values.h"

namespace tool {

// For Command::option and the like: keeps the text; or refuses the empty one and keeps the others.
Command::Take into(std::string& strTarget);
Command::Take notEmptyInto(std::string& strTarget);

// Adds an option that takes "API:METHOD,..." and may be given several times.
void addAllowances(Command& command, const std::string& strName, std::vector<Allowance>& allowances,
                   const std::string& strDescription);

// Whose tokens, made for what, bound to which session.
struct Selection {
    std::optional<unsigned int> nUid;
    std::optional<std::string> strFunction;
    std::optional<std::string> strSid;

    bool empty() const { return !nUid && !strFunction && !strSid; }
    Json::Value filter() const; // in the library's filter language
};
void addSelection(Command& command, Selection& selection);

// --uid and --user, which exclude each other.
void addUser(Command& command, std::optional<unsigned int>& nUid);

// --uses and --unlimited, which exclude each other, as a token's count.
void addUses(Command& command, std::optional<int64_t>& nCount);

// The lifetime that an option names.
void addTtl(Command& command, std::optional<int64_t>& nTtl);

void addExtra(Command& command, std::optional<Json::Value>& jExtra);

// The argument TID.
void addTid(Command& command, std::string& strTid);

// The ids that an argument of a name stands for: itself, or for "-" the lines of standard input. Fails
// when there is none.
std::vector<std::string> readTids(const std::string& strName, const std::string& strArgument);

// The same for commands that take one id.
std::string readTid(const std::string& strName, const std::string& strArgument);

// What is said of an id that no token has.
Failure noSuchToken();

} // namespace tool

#endif
