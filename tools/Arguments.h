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

// Names in them that are seldom meant, a sentence about each: they are compared byte by byte.
std::vector<std::string> doubtsAbout(const std::string& strName, const std::vector<Allowance>& allowances);

// Which tokens: those that fulfil all that is asked for.
struct Selection {
    std::optional<unsigned int> nUid;
    std::optional<std::string> strFunction;
    std::optional<std::string> strSid;
    std::optional<int64_t> nCreatedBefore; // seconds since the epoch
    std::optional<int64_t> nCreatedAfter;
    std::vector<Allowance> opens;
    std::optional<int64_t> nExpiring; // within so many seconds
    bool blExpired = false;
    bool blUnlimited = false;
    bool blNoOwner = false;

    // Whether it asks for nothing, and so selects all.
    bool empty() const;

    // As a condition in SQL. To know which owners are gone, it looks at the store and up all users.
    std::string sql() const;
};
void addSelection(Command& command, Selection& selection);

// How many tokens there are of them.
uint64_t countSelected(const Selection& selection);

// --uid and --user, which exclude each other.
void addUser(Command& command, std::optional<unsigned int>& nUid);

// --uses and --unlimited, which exclude each other, as a token's count.
void addUses(Command& command, std::optional<int64_t>& nCount);

// The lifetime that an option names.
void addTtl(Command& command, std::optional<int64_t>& nTtl);

void addExtra(Command& command, std::optional<Json::Value>& jExtra);

// The administrator's note on a token, which stands in its data.
void addNote(Command& command, std::optional<std::string>& strNote);

// Writes a note into a token's data, an object; "" removes it.
void setNote(Json::Value& jExtra, const std::string& strNote);

// The argument TID.
void addTid(Command& command, std::string& strTid);

// The ids that an argument of a name stands for: itself, or for "-" the lines of standard input, of which
// there can be none.
std::vector<std::string> readTids(const std::string& strName, const std::string& strArgument);

// The same for commands that take one id. Fails when there is none.
std::string readTid(const std::string& strName, const std::string& strArgument);

// What is said of an id that no token has.
Failure noSuchToken();

} // namespace tool

#endif
