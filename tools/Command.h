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

// The names of options are "--name" or "-n,--name", those of arguments are "NAME". The variables that options
// and arguments are stored in must outlive the command.
class Command {
public:
    // Does the command's work, after all arguments were read. Returns the exit status.
    typedef std::function<int()> Run;

    Command(std::string strName, std::string strDescription, Run run);

    void flag(const std::string& strName, bool& blFlag, const std::string& strDescription);
    void flag(const std::string& strName, std::function<void()> set, const std::string& strDescription);

    // Takes the text of an option or argument, once for each time it is given. If it throws BadValue, the
    // command fails with a usage failure that names the option.
    typedef std::function<void(const std::string&)> Take;

    // An option, or an argument.
    struct Parameter {
        std::string strName; // "--name" or "NAME"
        std::string strType; // what help calls the option's text; "" for a flag, which has none
        std::string strDescription;
        Take take;
        bool blRepeated; // may be given more than once; so may flags
        bool blRequired = false;
        char cShort = '\0'; // none
        std::vector<std::string> strExcluded = {};
        bool blGiven = false; // on the command line
    };

    // An option or argument of the command line, with its text; "" for a flag.
    struct Word {
        Parameter* pParameter;
        std::string strText;
    };

    void option(const std::string& strName, const std::string& strType, Take take,
                const std::string& strDescription);
    void repeatedOption(const std::string& strName, const std::string& strType, Take take,
                        const std::string& strDescription);

    // Each adds the next argument; remainingArguments() adds one that takes all that are left.
    void argument(const std::string& strName, Take take, const std::string& strDescription);
    void optionalArgument(const std::string& strName, Take take, const std::string& strDescription);
    void remainingArguments(const std::string& strName, Take take, const std::string& strDescription);

    // An example for help, without the program's and the command's name.
    void example(const std::string& strArguments);

    // For options and arguments that were added before. The names are "--name" or "NAME".
    void require(const std::string& strName);
    void exclude(const std::string& strName, const std::string& strOther);

    const std::string& name() const { return m_strName; }
    const std::string& description() const { return m_strDescription; }
    const std::vector<Parameter>& options() const { return m_options; }
    const std::vector<Parameter>& arguments() const { return m_arguments; }
    std::string help() const;

    // Reads a command line that begins with the command's name, and keeps the texts byte for byte. Throws
    // Failure for what cannot be read, and if Take refuses a text before that. take() checks what is required
    // and excluded. Once in a process, unless getopt_long() is reset before.
    void read(int nArguments, char** rgArguments);

    // What was read, in the order of the command line.
    const std::vector<Word>& words() const { return m_words; }

    // Whether an option was read.
    bool has(const std::string& strName) const;

    // Checks what is required and excluded, and passes each text to its Take, in the order of the command
    // line. Throws Failure.
    void take();

    int run() const { return m_run(); }

private:
    Parameter* find(const std::string& strName); // or nullptr
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
    std::vector<Word> m_words;
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

// A line of a help text, at most 80 columns wide: a name, and what it is. It continues on more lines where
// needed.
std::string helpLine(const std::string& strName, const std::string& strDescription);

} // namespace tool

#endif
