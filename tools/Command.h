// One command of the tool: its options and arguments, how they are read, and its help.

#ifndef TOOLS_COMMAND_H
#define TOOLS_COMMAND_H

#include <functional>
#include <string>
#include <utility>
#include <vector>

#include "Failure.h"

struct option; // of <getopt.h>

namespace tool {

// Names of options are "--name" or "-n,--name", those of arguments "NAME". What an option or argument
// stores to must outlive the command.
class Command {
public:
    // What it does when all arguments have been read; returns the exit status.
    typedef std::function<int()> Run;

    Command(std::string strName, std::string strDescription, Run run);

    void flag(const std::string& strName, bool& blFlag, const std::string& strDescription);
    void flag(const std::string& strName, std::function<void()> set, const std::string& strDescription);

    // Takes the text of each occurrence; a BadValue becomes a usage failure that names the option.
    typedef std::function<void(const std::string&)> Take;

    // An option, or an argument.
    struct Parameter {
        std::string strName; // "--name" or "NAME"
        std::string strType; // of an option; "" for a flag, which takes no text
        std::string strDescription;
        Take take;
        bool blRepeated; // may be given more than once, as flags may
        bool blRequired = false;
        char cShort = '\0'; // none
        std::vector<std::string> strExcluded = {};
        bool blGiven = false; // on the command line
    };

    // A text of the command line; "" of a flag.
    struct Word {
        Parameter* pParameter;
        std::string strText;
    };

    void option(const std::string& strName, const std::string& strType, Take take,
                const std::string& strDescription);
    void repeatedOption(const std::string& strName, const std::string& strType, Take take,
                        const std::string& strDescription);

    // The next argument, or all that are left.
    void argument(const std::string& strName, Take take, const std::string& strDescription);
    void optionalArgument(const std::string& strName, Take take, const std::string& strDescription);
    void remainingArguments(const std::string& strName, Take take, const std::string& strDescription);

    // A command line that help shows, from behind the command's name.
    void example(const std::string& strArguments);

    // Of those that have been added, by "--name" or "NAME".
    void require(const std::string& strName);
    void exclude(const std::string& strName, const std::string& strOther);

    const std::string& name() const { return m_strName; }
    const std::string& description() const { return m_strDescription; }
    const std::vector<Parameter>& options() const { return m_options; }
    const std::vector<Parameter>& arguments() const { return m_arguments; }
    std::string help() const;

    // Notes the texts of a command line that begins with the command's name, byte for byte. Throws Failure
    // where it cannot be read, or about what stands before that; what is missing or excluded is for take().
    void read(int nArguments, char** rgArguments);

    // What was read, in its order.
    const std::vector<Word>& words() const { return m_words; }

    // Whether an option was read.
    bool has(const std::string& strName) const;

    // Checks what is required and excluded, and hands each text to its Take, in the order of the command
    // line. Throws Failure.
    void take();

    int run() const { return m_run(); }

private:
    Parameter* find(const std::string& strName); // nullptr: there is none
    void addOption(const std::string& strNames, Parameter parameter);
    void addWord(Parameter& parameter, const char* szText);
    void addOptionText(Parameter& option, const char* szText);
    void addArgument(const char* szText);
    void addFound(int nFound);
    std::string shortOptions() const;
    std::vector<struct option> longOptions() const;
    Parameter& optionOf(int nFound);
    void requireLongName(const std::string& strName);
    void readWords(int nArguments, char** rgArguments);
    void takeWords() const;
    void check() const;

    const std::string m_strName;
    const std::string m_strDescription;
    const Run m_run;
    std::vector<Parameter> m_options;
    std::vector<Parameter> m_arguments;
    std::vector<std::string> m_strExamples;
    std::vector<Word> m_words; // as read
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

// Two columns of a help text, of 80 together: names, and what they are.
std::string helpLine(const std::string& strName, const std::string& strDescription);

} // namespace tool

#endif
