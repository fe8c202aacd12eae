// The commands of the tool.

#ifndef TOOLS_COMMANDS_H
#define TOOLS_COMMANDS_H

#include <array>
#include <deque>
#include <string>

#include "Command.h"

namespace tool {

class Commands {
public:
    enum class Needs { Root, Nothing };

    // Adds a command. run owns the variables that the options are stored in. The reference stays valid.
    Command& add(const std::string& strName, const std::string& strDescription, const Command::Run& run,
                 Needs needs = Needs::Root);

    const std::deque<Command>& all() const { return m_commands; }

    // Reads the arguments and runs the command. Throws Failure.
    int run(int nArguments, char** rgArguments);

    std::string help() const;

    // Finds a command by its name. Throws Failure if there is none.
    Command& find(const std::string& strName);

private:
    std::deque<Command> m_commands;
    bool m_blVerbose = false;
};

void addCreate(Commands& commands);
void addGenerate(Commands& commands);
void addList(Commands& commands);
void addShow(Commands& commands);
void addCheck(Commands& commands);
void addGrant(Commands& commands);
void addUpdate(Commands& commands);
void addRotate(Commands& commands);
void addRevoke(Commands& commands);
void addPurge(Commands& commands);
void addStats(Commands& commands);
void addExport(Commands& commands);
void addImport(Commands& commands);
void addInit(Commands& commands);
void addDoctor(Commands& commands);
void addTune(Commands& commands);
void addHelp(Commands& commands);

// All commands, in the order of the help text.
struct CommandEntry {
    const char* szName;
    void (*add)(Commands&);
};
extern const std::array<CommandEntry, 17> COMMANDS;

} // namespace tool

#endif
