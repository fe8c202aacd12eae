#include "Commands.h"

#include <algorithm>

#include "AccessTokenDefine.h"
#include "Console.h"
#include "Place.h"
#include "Store.h"

namespace {

const char* const VERSION_TEXT = "vemo-access-token " VEMO_ATOKEN_VERSION "\n";

const char* const HELP = "print this help and exit";
const char* const VERSION = "print the version and exit";

// A sentence about the arguments; one that is long may be an id in the wrong place, and is shortened. Those
// that stand in others come after them.
std::string withoutIds(std::string strSentence, std::vector<std::string> strArguments)
{
    std::sort(strArguments.begin(), strArguments.end(),
              [](const std::string& strOne, const std::string& strOther) {
                  return strOne.size() > strOther.size();
              });
    for (const std::string& strArgument : strArguments) {
        const size_t nPosition = strSentence.find(strArgument);
        if (strArgument.size() >= VEMO_ATOKEN_LENGTH_MIN && nPosition != std::string::npos) {
            strSentence.replace(nPosition, strArgument.size(), tool::shortened(strArgument));
        }
    }
    return strSentence;
}

int printText(const std::string& strText)
{
    tool::print(strText);
    tool::flushResult();
    return tool::EXIT_STATUS_DONE;
}

} // namespace

namespace tool {

Command& Commands::add(const std::string& strName, const std::string& strDescription, const Command::Run& run,
                       Needs needs)
{
    const auto runAsRoot = [run] {
        requireRoot();
        return run();
    };
    Command& command =
        m_commands.emplace_back(strName, strDescription, Needs::Root == needs ? runAsRoot : run);
    // Whoever asks for these two gets them, whatever else is missing.
    const auto later = [] {};
    command.flag("-h,--help", later, HELP);
    command.flag("--version", later, VERSION);
    command.flag("-v,--verbose", m_blVerbose, "show the library's log lines on standard error");
    return command;
}

std::string Commands::help() const
{
    std::string strCommands;
    for (const Command& command : m_commands) {
        strCommands += helpLine(command.name(), command.description());
    }
    return "Usage: vemo-access-token [OPTIONS] COMMAND\n"
           "Administers the access tokens of this machine.\n"
           "\nOptions:\n" +
           helpLine("-h,--help", HELP) + helpLine("--version", VERSION) + "\nCommands:\n" + strCommands +
           "\n\"vemo-access-token COMMAND --help\" tells more, and so does vemo-access-token(8).\n\n"
           "Exit status: 0 done or granted, 1 refused (grant, check), 2 usage, 3 no such token,\n"
           "4 store or permission failure, 5 doctor has findings.\n";
}

Command& Commands::find(const std::string& strName)
{
    for (Command& command : m_commands) {
        if (command.name() == strName) {
            return command;
        }
    }
    const char* const szWhat = '-' == strName[0] ? "unknown option" : "unknown command";
    throw Failure(EXIT_STATUS_USAGE, std::string(szWhat) + " \"" + strName + "\"");
}

int Commands::run(int nArguments, char** rgArguments)
{
    const std::vector<std::string> strArguments(rgArguments + 1, rgArguments + nArguments);
    if (strArguments.empty()) {
        throw Failure(EXIT_STATUS_USAGE, "say what to do; \"vemo-access-token --help\" lists the commands");
    }
    if ("-h" == strArguments[0] || "--help" == strArguments[0]) {
        return printText(help());
    }
    if ("--version" == strArguments[0]) {
        return printText(VERSION_TEXT);
    }
    Command* pCommand = nullptr;
    try {
        pCommand = &find(strArguments[0]);
        pCommand->read(nArguments - 1, rgArguments + 1);
        if (pCommand->has("--help")) {
            return printText(pCommand->help());
        }
        if (pCommand->has("--version")) {
            return printText(VERSION_TEXT);
        }
        pCommand->take();
    } catch (const Failure& failure) {
        throw Failure(failure.status(), withoutIds(failure.what(), strArguments));
    }
    if (m_blVerbose) {
        showLogLines();
    }
    const int nStatus = pCommand->run();
    try {
        flushResult();
    } catch (const Failure& failure) {
        throw Failure(failure.status(), failure.fact(), Store::hasChanged() ? "the change was made" : "");
    }
    return nStatus;
}

} // namespace tool
