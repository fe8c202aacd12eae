// Prints the completion for a shell: reads a template, and puts the commands and their options in place of
// the line "@COMMANDS@".
//
// usage: completions bash|zsh|fish <TEMPLATE

#include <algorithm>
#include <iostream>
#include <sstream>

#include "tools/Commands.h"
#include "tools/Sql.h"

namespace {

using tool::Command;
typedef Command::Parameter Parameter;

// How a shell completes the value of an option. "@" is replaced by words.
struct Actions {
    std::string strUids;
    std::string strUsers;
    std::string strData; // JSON, or "@" and the name of a file
    std::string strWords;
    std::string strList; // words, separated by commas
    std::string strNone;
    std::string strColon; // how to write a colon within a word
};

const Actions BASH = {"_uids",
                      "COMPREPLY=($(compgen -u -- \"$cur\"))",
                      "_vemo_access_token_at_file",
                      "_vemo_access_token_words '@'",
                      "_vemo_access_token_list '@'",
                      ":",
                      ":"};
const Actions ZSH = {"_vemo-access-token-uids",
                     "_users",
                     "_vemo-access-token-extra",
                     "(@)",
                     "_values -s , NAME @",
                     " ",
                     "\\:"};
const Actions FISH = {"(__fish_complete_user_ids)",
                      "(__fish_complete_users)",
                      "(__vemo_access_token_at_file)",
                      "@",
                      "(__fish_append , @)",
                      "",
                      ":"};

std::string replaced(std::string strText, char cOld, const std::string& strNew)
{
    for (size_t n = strText.find(cOld); n != std::string::npos; n = strText.find(cOld, n + strNew.size())) {
        strText.replace(n, 1, strNew);
    }
    return strText;
}

std::string joined(const std::vector<std::string>& strWords)
{
    std::string strText;
    for (const std::string& strWord : strWords) {
        strText += (strText.empty() ? "" : " ") + strWord;
    }
    return strText;
}

// The forms of output that a description of --output names.
std::string formsIn(const std::string& strDescription)
{
    std::istringstream words(replaced(strDescription, ',', ""));
    std::vector<std::string> strForms;
    for (std::string strWord; words >> strWord;) {
        for (const char* szForm : {"table", "json", "jsonl", "csv", "metrics"}) {
            if (strWord == szForm) {
                strForms.push_back(strWord);
            }
        }
    }
    return joined(strForms);
}

std::string ordersOf(const std::string& strColon)
{
    std::vector<std::string> strOrders = tool::fieldNames();
    for (const std::string& strName : tool::fieldNames()) {
        strOrders.push_back(strName + strColon + "desc");
    }
    return joined(strOrders);
}

std::string actionOf(const Parameter& option, const Actions& actions)
{
    const std::string& strName = option.strName;
    const std::string& strDescription = option.strDescription;
    if (strName == "--columns") {
        const size_t nColumns = strDescription.rfind(':') + 2;
        return replaced(actions.strList, '@', replaced(strDescription.substr(nColumns), ',', ""));
    }
    const std::string strWords = strName == "--output"  ? formsIn(strDescription)
                                 : strName == "--field" ? joined(tool::fieldNames())
                                 : strName == "--sort"  ? ordersOf(actions.strColon)
                                                        : "";
    return !strWords.empty()      ? replaced(actions.strWords, '@', strWords)
           : strName == "--uid"   ? actions.strUids
           : strName == "--user"  ? actions.strUsers
           : strName == "--extra" ? actions.strData
                                  : actions.strNone;
}

void printBash(const tool::Commands& commands)
{
    std::vector<std::string> strCommands;
    std::ostringstream options;
    std::ostringstream values;
    for (const Command& command : commands.all()) {
        strCommands.push_back(command.name());
        std::vector<std::string> strNames;
        for (const Parameter& option : command.options()) {
            strNames.push_back(option.strName);
            if (!option.strType.empty()) {
                values << "        '" << command.name() << " " << option.strName << "') "
                       << actionOf(option, BASH) << " ;;\n";
            }
        }
        const auto& arguments = command.arguments();
        options << "        " << command.name() << ") options='" << joined(strNames)
                << "' argument=" << (arguments.empty() ? "" : arguments[0].strName) << " ;;\n";
    }
    std::cout << "    local commands='" << joined(strCommands) << "'\n    case $command in\n"
              << options.str() << "    esac\n    case \"$command $option\" in\n"
              << values.str() << "        *) option= ;;\n    esac\n    [[ $option ]] && return\n";
}

// The names of the options that cannot be used with this one; also its own names, if it has two.
std::string excludedBy(const Command& command, const Parameter& option)
{
    const auto excludes = [](const Parameter& one, const Parameter& other) {
        return std::count(one.strExcluded.begin(), one.strExcluded.end(), other.strName);
    };
    std::vector<std::string> strNames;
    for (const Parameter& other : command.options()) {
        const bool blItself = &other == &option;
        if (blItself ? option.cShort : excludes(option, other) || excludes(other, option)) {
            strNames.push_back(other.strName);
            if (other.cShort) {
                strNames.push_back(std::string("-") + other.cShort);
            }
        }
    }
    return joined(strNames);
}

std::string zshOption(const Command& command, const Parameter& option)
{
    const bool blValue = !option.strType.empty();
    const bool blAlone = option.strName == "--help" || option.strName == "--version";
    const std::string strExcluded = excludedBy(command, option);
    std::string strSpec = blAlone ? "(- : *)" : strExcluded.empty() ? "" : "(" + strExcluded + ")";
    if (option.cShort) {
        strSpec += std::string("'{-") + option.cShort + (blValue ? "+," : ",") + option.strName +
                   (blValue ? "=" : "") + "}'";
    } else {
        strSpec += (blValue && option.blRepeated ? "*" : "") + option.strName + (blValue ? "=" : "");
    }
    strSpec += "[" + replaced(option.strDescription, '\'', "'\\''") + "]";
    if (blValue) {
        strSpec +=
            ":" + option.strType.substr(0, option.strType.find_first_of(":[")) + ":" + actionOf(option, ZSH);
    }
    return strSpec;
}

void printZsh(const tool::Commands& commands)
{
    std::cout << "    commands=(\n";
    for (const Command& command : commands.all()) {
        std::cout << "        '" << command.name() << ":" << replaced(command.description(), '\'', "'\\''")
                  << "'\n";
    }
    std::cout << "    )\n    case $command in\n";
    for (const Command& command : commands.all()) {
        std::cout << "        " << command.name() << ") arguments=(\n";
        for (const Parameter& option : command.options()) {
            std::cout << "            '" << zshOption(command, option) << "'\n";
        }
        int nArgument = 0;
        for (const Parameter& argument : command.arguments()) {
            const std::string& strName = argument.strName;
            const std::string strPlace = std::to_string(++nArgument) + (argument.blRequired ? ":" : "::");
            std::cout << "            '" << (argument.blRepeated ? "*:" : strPlace) << strName << ":"
                      << (strName == "FILE"      ? "_files"
                          : strName == "COMMAND" ? "_vemo-access-token-commands"
                                                 : " ")
                      << "'\n";
        }
        std::cout << "        ) ;;\n";
    }
    std::cout << "    esac\n";
}

void printFish(const tool::Commands& commands)
{
    for (const Command& command : commands.all()) {
        const auto print = [&command](const std::string& strFunction, const std::string& strName,
                                      const std::string& strDescription) -> std::ostream& {
            return std::cout << "__vemo_access_token_" << strFunction << " " << command.name() << strName
                             << " '" << replaced(strDescription, '\'', "\\'") << "'";
        };
        const bool blFiles = !command.arguments().empty() && command.arguments()[0].strName == "FILE";
        print("command", "", command.description()) << (blFiles ? " -F" : "") << "\n";
        for (const Parameter& option : command.options()) {
            print("option", " " + option.strName.substr(2), option.strDescription);
            if (option.cShort) {
                std::cout << " -s " << option.cShort;
            }
            if (!option.strType.empty()) {
                std::cout << " -x -a '" << actionOf(option, FISH) << "'";
            }
            std::cout << "\n";
        }
    }
}

} // namespace

int main(int argc, char** argv)
{
    const std::string strShell = 2 == argc ? argv[1] : "";
    tool::Commands commands;
    for (const tool::CommandEntry& entry : tool::COMMANDS) {
        entry.add(commands);
    }
    for (std::string strLine; std::getline(std::cin, strLine);) {
        if (strLine != "@COMMANDS@") {
            std::cout << strLine << "\n";
        } else if (strShell == "bash") {
            printBash(commands);
        } else if (strShell == "zsh") {
            printZsh(commands);
        } else {
            printFish(commands);
        }
    }
    return std::cout.flush() ? 0 : 1;
}
