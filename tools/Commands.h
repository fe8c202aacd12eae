// The commands, and how one of them is chosen and run.

#ifndef TOOLS_COMMANDS_H
#define TOOLS_COMMANDS_H

#include <CLI/CLI.hpp>

#include <functional>
#include <string>

namespace tool {

class Commands {
public:
    // What a command does when all arguments have been read; returns the exit status.
    typedef std::function<int()> Run;

    enum class Needs { Root, Nothing };

    Commands();

    // Adds a command. run keeps alive what the options are stored in.
    CLI::App& add(const std::string& strName, const std::string& strDescription, Run run,
                  Needs needs = Needs::Root);

    // Reads the arguments and runs the command. Throws Failure.
    int run(int nArguments, char** rgArguments);

private:
    CLI::App m_app;
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
