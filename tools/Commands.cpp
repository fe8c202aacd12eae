#include "Commands.h"

#include <CLI/CLI.hpp>
#include <algorithm>

#include "AccessTokenDefine.h"
#include "Console.h"
#include "Place.h"
#include "Store.h"

namespace {

const char* const VERSION_TEXT = "vemo-access-token " VEMO_ATOKEN_VERSION;

// Adds an option or argument that is given once at most.
CLI::Option& addSingle(CLI::App& app, const std::string& strName, const std::string& strShown,
                       const tool::Command::Take& take, const std::string& strDescription)
{
    const auto taken = [strShown, take](const std::string& strText) {
        tool::argument(strShown, [&] { take(strText); });
    };
    return *app.add_option_function<std::string>(strName, taken, strDescription);
}

// Adds one that can be given more often.
CLI::Option& addRepeated(CLI::App& app, const std::string& strName, const tool::Command::Take& take,
                         const std::string& strDescription)
{
    const auto takenAll = [strName, take](const std::vector<std::string>& strTexts) {
        for (const std::string& strText : strTexts) {
            tool::argument(strName, [&] { take(strText); });
        }
    };
    return *app.add_option_function<std::vector<std::string>>(strName, takenAll, strDescription);
}

// The arguments, with "--name=" as "--name" and an empty text: the parser would take the next argument
// for its value.
std::vector<std::string> argumentsOf(int nArguments, char** rgArguments)
{
    std::vector<std::string> strArguments;
    for (int i = 1; i < nArguments; ++i) {
        std::string strArgument = rgArguments[i];
        const bool blEmptyValue =
            0 == strArgument.compare(0, 2, "--") && strArgument.find('=') == strArgument.size() - 1;
        if (blEmptyValue) {
            strArgument.pop_back();
        }
        strArguments.push_back(strArgument);
        if (blEmptyValue) {
            strArguments.push_back("");
        }
    }
    return strArguments;
}

// The parser's "NAME: At Most 1 required but received 2", "NAME: 1 required TYPE missing" and "NAME was given
// a disallowed flag override", in English.
std::string mismatchText(const std::string& strSentence)
{
    if (strSentence.find(" disallowed ") != std::string::npos) {
        return "--" + strSentence.substr(0, strSentence.find(' ')) + ": takes no value";
    }
    const bool blMissing = strSentence.find(" missing") != std::string::npos;
    return strSentence.substr(0, strSentence.find(": ")) +
           (blMissing ? ": needs a value" : ": can be given once only");
}

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

} // namespace

namespace tool {

void Command::flag(const std::string& strName, bool& blFlag, const std::string& strDescription)
{
    m_app.add_flag(strName, blFlag, strDescription)->disable_flag_override();
}

void Command::flag(const std::string& strName, std::function<void()> set, const std::string& strDescription)
{
    m_app.add_flag_callback(strName, std::move(set), strDescription)->disable_flag_override();
}

void Command::option(const std::string& strName, const std::string& strType, const Take& take,
                     const std::string& strDescription)
{
    addSingle(m_app, strName, strName.substr(strName.find("--")), take, strDescription).type_name(strType);
}

void Command::repeatedOption(const std::string& strName, const std::string& strType, const Take& take,
                             const std::string& strDescription)
{
    addRepeated(m_app, strName, take, strDescription).allow_extra_args(false)->type_name(strType);
}

void Command::argument(const std::string& strName, const Take& take, const std::string& strDescription)
{
    optionalArgument(strName, take, strDescription);
    require(strName);
}

void Command::optionalArgument(const std::string& strName, const Take& take,
                               const std::string& strDescription)
{
    addSingle(m_app, strName, strName, take, strDescription).type_name("");
}

void Command::remainingArguments(const std::string& strName, const Take& take,
                                 const std::string& strDescription)
{
    addRepeated(m_app, strName, take, strDescription).type_name("");
}

void Command::require(const std::string& strName)
{
    m_app.get_option(strName)->required();
}

void Command::exclude(const std::string& strName, const std::string& strOther)
{
    m_app.get_option(strName)->excludes(m_app.get_option(strOther));
}

Commands::Commands()
    : m_pApp(
          std::make_unique<CLI::App>("Administers the access tokens of this machine.", "vemo-access-token"))
{
    m_pApp->set_help_flag("-h,--help", "print this help and exit");
    m_pApp->set_version_flag("--version", VERSION_TEXT, "print the version and exit");
    m_pApp->require_subcommand(0, 1);
    m_pApp->get_formatter()->label("SUBCOMMAND", "COMMAND");
    m_pApp->footer("\"vemo-access-token COMMAND --help\" tells more, and so does vemo-access-token(8).\n\n"
                   "Exit status: 0 done or granted, 1 refused (grant, check), 2 usage, 3 no such token,\n"
                   "4 store or permission failure, 5 doctor has findings.");
}

Commands::~Commands() = default;

Command Commands::add(const std::string& strName, const std::string& strDescription, const Run& run,
                      Needs needs)
{
    CLI::App& app = *m_pApp->add_subcommand(strName, strDescription);
    app.footer("");
    app.group("Commands");
    app.set_help_flag("-h,--help", "print this help and exit");
    app.set_version_flag("--version", VERSION_TEXT, "print the version and exit");
    app.add_flag("-v,--verbose", m_blVerbose, "show the library's log lines on standard error")
        ->disable_flag_override();
    app.callback([this, run, needs] {
        m_run = [run, needs] {
            if (Needs::Root == needs) {
                requireRoot();
            }
            return run();
        };
    });
    return Command(app);
}

int Commands::run(int nArguments, char** rgArguments)
{
    const std::vector<std::string> strArguments = argumentsOf(nArguments, rgArguments);
    try {
        m_pApp->parse(
            std::vector<std::string>(strArguments.rbegin(), strArguments.rend())); // as it wants them
    } catch (const CLI::Success& help) {                                           // --help or --version
        std::ostringstream text;
        m_pApp->exit(help, text, text);
        print(text.str());
        flushResult();
        return EXIT_STATUS_DONE;
    } catch (const CLI::ArgumentMismatch& error) {
        throw Failure(EXIT_STATUS_USAGE, mismatchText(error.what()));
    } catch (const CLI::ParseError& error) {
        throw Failure(EXIT_STATUS_USAGE, withoutIds(error.what(), strArguments));
    } catch (const Failure& failure) {
        throw Failure(failure.status(), withoutIds(failure.what(), strArguments));
    }
    if (!m_run) {
        throw Failure(EXIT_STATUS_USAGE, "say what to do; \"vemo-access-token --help\" lists the commands");
    }
    if (m_blVerbose) {
        showLogLines();
    }
    const int nStatus = m_run();
    try {
        flushResult();
    } catch (const Failure& failure) {
        throw Failure(failure.status(), failure.fact(), Store::hasChanged() ? "the change was made" : "");
    }
    return nStatus;
}

} // namespace tool
