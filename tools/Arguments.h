// Options and arguments that several commands share.

#ifndef TOOLS_ARGUMENTS_H
#define TOOLS_ARGUMENTS_H

#include <CLI/CLI.hpp>
#include <json/value.h>

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "Failure.h"
#include "Values.h"

namespace tool {

// Adds an option whose text a function of Values.h reads into target.
template <typename Target, typename Parse>
CLI::Option* addParsed(CLI::App& command, const std::string& strName, const std::string& strType,
                       Target& target, Parse parse, const std::string& strDescription)
{
    const std::string strLongName = strName.substr(strName.find("--"));
    const auto read = [strLongName, &target, parse](const std::string& strText) {
        target = argument(strLongName, [&] { return parse(strText); });
    };
    return command.add_option_function<std::string>(strName, read, strDescription)->type_name(strType);
}

// Refuses the empty text.
CLI::Validator notEmpty();

// Adds an option that takes "API:METHOD,..." and may be given several times.
CLI::Option* addAllowances(CLI::App& command, const std::string& strName, std::vector<Allowance>& allowances,
                           const std::string& strDescription);

// Whose tokens, made for what, bound to which session.
struct Selection {
    std::optional<unsigned int> nUid;
    std::optional<std::string> strFunction;
    std::optional<std::string> strSid;

    bool empty() const { return !nUid && !strFunction && !strSid; }
    Json::Value filter() const; // in the library's filter language
};
void addSelection(CLI::App& command, Selection& selection);

// --uid and --user, which exclude each other.
void addUser(CLI::App& command, std::optional<unsigned int>& nUid);

// --uses and --unlimited, which exclude each other, as a token's count.
void addUses(CLI::App& command, std::optional<int64_t>& nCount);

// The lifetime that an option names.
CLI::Option* addTtl(CLI::App& command, std::optional<int64_t>& nTtl);

CLI::Option* addExtra(CLI::App& command, std::optional<Json::Value>& jExtra);

// The argument TID.
void addTid(CLI::App& command, std::string& strTid);

// The ids that an argument stands for: itself, or for "-" the lines of standard input. Fails when
// there is none.
std::vector<std::string> readTids(const std::string& strArgument);

// The same for commands that take one id.
std::string readTid(const std::string& strArgument);

// What is said of an id that no token has.
Failure noSuchToken();

} // namespace tool

#endif
