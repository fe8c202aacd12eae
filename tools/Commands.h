// The commands and their arguments. What parses the command line stays behind this.

#ifndef TOOLS_COMMANDS_H
#define TOOLS_COMMANDS_H

#include <functional>
#include <memory>
#include <string>

#include "Failure.h"

namespace CLI {
class App;
}

namespace tool {

// The options and arguments of one command. Names are "--name" or "-n,--name"; types stand in the help.
class Command {
public:
    explicit Command(CLI::App& app) : m_app(app) {}

    void flag(const std::string& strName, bool& blFlag, const std::string& strDescription);
    void flag(const std::string& strName, std::function<void()> set, const std::string& strDescription);

    // Takes the text of each occurrence; a BadValue becomes a usage failure that names the option.
    typedef std::function<void(const std::string&)> Take;
    void option(const std::string& strName, const std::string& strType, const Take& take,
                const std::string& strDescription);
    void repeatedOption(const std::string& strName, const std::string& strType, const Take& take,
                        const std::string& strDescription);

    // The next argument, or all that are left.
    void argument(const std::string& strName, const Take& take, const std::string& strDescription);
    void optionalArgument(const std::string& strName, const Take& take, const std::string& strDescription);
    void remainingArguments(const std::string& strName, const Take& take, const std::string& strDescription);

    void require(const std::string& strName);
    void exclude(const std::string& strName, const std::string& strOther);

private:
    CLI::App& m_app;
};

// Adds an option whose text parse() reads into target.
template <typename Target, typename Parse>
void addParsed(Command& command, const std::string& strName, const std::string& strType, Target& target,
               Parse parse, const std::string& strDescription)
{
    command.option(
        strName, strType, [&target, parse](const std::string& strText) { target = parse(strText); },
        strDescription);
}

class Commands {
public:
    // What a command does when all arguments have been read; returns the exit status.
    typedef std::function<int()> Run;

    enum class Needs { Root, Nothing };

    Commands();
    ~Commands();

    // Adds a command. run keeps alive what the options are stored in.
    Command add(const std::string& strName, const std::string& strDescription, const Run& run,
                Needs needs = Needs::Root);

    // Reads the arguments and runs the command. Throws Failure.
    int run(int nArguments, char** rgArguments);

private:
    std::unique_ptr<CLI::App> m_pApp;
    bool m_blVerbose = false;
    Run m_run;
};

void addCreate(Commands& commands);
void addGenerate(Commands& commands);
void addList(Commands& commands);
void addShow(Commands& commands);
void addCheck(Commands& commands);
void addGrant(Commands& commands);
void addUpdate(Commands& commands);
void addRevoke(Commands& commands);
void addPurge(Commands& commands);
void addStats(Commands& commands);
void addExport(Commands& commands);
void addImport(Commands& commands);
void addInit(Commands& commands);
void addDoctor(Commands& commands);
void addTune(Commands& commands);

} // namespace tool

#endif
