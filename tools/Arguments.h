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

// For Command::option and its siblings: the first stores the text; the second refuses an empty text and
// stores any other.
Command::Take into(std::string& strTarget);
Command::Take notEmptyInto(std::string& strTarget);

// Adds an option that takes "API:METHOD,..." and may be given several times.
void addAllowances(Command& command, const std::string& strName, std::vector<Allowance>& allowances,
                   const std::string& strDescription);

// A sentence about each name that the user probably did not mean, such as one with a "*": names are compared
// byte by byte. strName is the option's name.
std::vector<std::string> doubtsAbout(const std::string& strName, const std::vector<Allowance>& allowances);

// Selects the tokens that fulfil all conditions that are set.
struct Selection {
    std::optional<unsigned int> nUid;
    std::optional<std::string> strFunction;
    std::optional<std::string> strSid;
    std::optional<int64_t> nCreatedBefore; // seconds since the epoch
    std::optional<int64_t> nCreatedAfter;
    std::vector<Allowance> opens;
    std::optional<int64_t> nExpiring; // in seconds from now: the token expires within this time
    bool blExpired = false;
    bool blUnlimited = false;
    bool blNoOwner = false;

    // Whether no condition is set, so that all tokens are selected.
    bool empty() const;

    // The selection as a condition in SQL. With blNoOwner, this reads the store and looks up all owners.
    std::string sql() const;
};
void addSelection(Command& command, Selection& selection);

// How many tokens the selection has.
uint64_t countSelected(const Selection& selection);

// --uid and --user, which exclude each other.
void addUser(Command& command, std::optional<unsigned int>& nUid);

// --uses and --unlimited, which exclude each other, as a token's count.
void addUses(Command& command, std::optional<int64_t>& nCount);

// --ttl, the lifetime in seconds.
void addTtl(Command& command, std::optional<int64_t>& nTtl);

void addExtra(Command& command, std::optional<Json::Value>& jExtra);

// --note, the administrator's note on a token. It is kept in the token's field "extra".
void addNote(Command& command, std::optional<std::string>& strNote);

// Writes a note into a token's "extra", which must be an object; "" removes the note.
void setNote(Json::Value& jExtra, const std::string& strNote);

// The argument TID.
void addTid(Command& command, std::string& strTid);

// The ids that the argument strName stands for: the argument itself, or for "-" the lines of standard input,
// which can be empty.
std::vector<std::string> readTids(const std::string& strName, const std::string& strArgument);

// The id that the argument strName of a command stands for. Fails unless there is exactly one.
std::string readTid(const std::string& strName, const std::string& strArgument);

// The failure for an id that no token has.
Failure noSuchToken();

} // namespace tool

#endif
