#include "Commands.h"

#include <memory>

#include "Arguments.h"
#include "Audit.h"
#include "Change.h"
#include "Console.h"
#include "LogLines.h"
#include "Masking.h"
#include "Nearest.h"
#include "Place.h"

namespace {

const char* const VERSION_TEXT = "vemo-access-token " VEMO_ATOKEN_VERSION "\n";

const char* const HELP = "print this help and exit";
const char* const VERSION = "print the version and exit";

// Also logs changes that are made without opening the store.
int runAudited(const tool::Command& command)
{
    tool::audit::setCommand(command.name());
    const tool::audit::Teller teller;
    return command.run();
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
    // run() handles these two before anything that is missing or excluded.
    const auto nothing = [] {};
    command.flag("-h,--help", nothing, HELP);
    command.flag("-V,--version", nothing, VERSION);
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
           helpLine("-h,--help", HELP) + helpLine("-V,--version", VERSION) + "\nCommands:\n" + strCommands +
           "\n\"vemo-access-token help COMMAND\" tells more, and so does vemo-access-token(8).\n\n"
           "Exit status: 0 done or granted, 1 refused (grant, check), 2 usage,\n"
           "3 no such token, 4 store or permission failure, 5 doctor has findings.\n";
}

Command& Commands::find(const std::string& strName)
{
    for (Command& command : m_commands) {
        if (command.name() == strName) {
            return command;
        }
    }
    if ('-' == strName[0]) {
        throw Failure(EXIT_STATUS_USAGE, "unknown option " + quoted(strName),
                      didYouMean(strName, {"--help", "--version"}));
    }
    std::vector<std::string> strNames;
    for (const Command& command : m_commands) {
        strNames.push_back(command.name());
    }
    throw Failure(EXIT_STATUS_USAGE, "unknown command " + quoted(strName), didYouMean(strName, strNames));
}

int Commands::run(int nArguments, char** rgArguments)
{
    if (nArguments < 2) {
        throw Failure(EXIT_STATUS_USAGE, "say what to do; \"vemo-access-token --help\" lists the commands");
    }
    const std::string strFirst = rgArguments[1];
    if ("-h" == strFirst || "--help" == strFirst) {
        return printText(help());
    }
    if ("-V" == strFirst || "--version" == strFirst) {
        return printText(VERSION_TEXT);
    }
    Command& command = find(strFirst);
    command.read(nArguments - 1, rgArguments + 1);
    if (command.has("--help")) {
        return printText(command.help());
    }
    if (command.has("--version")) {
        return printText(VERSION_TEXT);
    }
    command.take();
    const LogLines logLines(m_blVerbose);
    const int nStatus = runAudited(command);
    try {
        flushResult();
    } catch (const Failure& failure) {
        throw Failure(failure.status(), failure.fact(), hasChanged() ? "the change was made" : "");
    }
    return nStatus;
}

void addHelp(Commands& commands)
{
    auto pName = std::make_shared<std::string>();
    const auto help = [&commands, pName] {
        print(pName->empty() ? commands.help() : commands.find(*pName).help());
        return EXIT_STATUS_DONE;
    };
    Command& command = commands.add("help", "print what a command takes, or which commands there are", help,
                                    Commands::Needs::Nothing);
    command.optionalArgument("COMMAND", notEmptyInto(*pName), "its name");
    command.example("create");
    command.example("list");
}

const std::array<CommandEntry, 17> COMMANDS = {{
    {"create", addCreate},
    {"generate", addGenerate},
    {"list", addList},
    {"show", addShow},
    {"check", addCheck},
    {"grant", addGrant},
    {"update", addUpdate},
    {"rotate", addRotate},
    {"revoke", addRevoke},
    {"purge", addPurge},
    {"stats", addStats},
    {"export", addExport},
    {"import", addImport},
    {"init", addInit},
    {"doctor", addDoctor},
    {"tune", addTune},
    {"help", addHelp},
}};

} // namespace tool
