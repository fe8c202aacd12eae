#include "Commands.h"

#include <CLI/CLI.hpp>

#include "Console.h"
#include "Place.h"

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

} // namespace

namespace tool {

void Command::flag(const std::string& strName, bool& blFlag, const std::string& strDescription)
{
    m_app.add_flag(strName, blFlag, strDescription);
}

void Command::flag(const std::string& strName, std::function<void()> set, const std::string& strDescription)
{
    m_app.add_flag_callback(strName, std::move(set), strDescription);
}

void Command::option(const std::string& strName, const std::string& strType, Take take,
                     const std::string& strDescription)
{
    addSingle(m_app, strName, strName.substr(strName.find("--")), take, strDescription).type_name(strType);
}

void Command::repeatedOption(const std::string& strName, const std::string& strType, Take take,
                             const std::string& strDescription)
{
    addRepeated(m_app, strName, take, strDescription).allow_extra_args(false)->type_name(strType);
}

void Command::argument(const std::string& strName, Take take, const std::string& strDescription)
{
    optionalArgument(strName, std::move(take), strDescription);
    require(strName);
}

void Command::optionalArgument(const std::string& strName, Take take, const std::string& strDescription)
{
    addSingle(m_app, strName, strName, take, strDescription).type_name("");
}

void Command::remainingArguments(const std::string& strName, Take take, const std::string& strDescription)
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
    m_pApp->footer("\"vemo-access-token COMMAND --help\" tells more, and so does vemo-access-token(8).\n\n"
                   "Exit status: 0 done or granted, 1 refused (grant, check), 2 usage, 3 no such token,\n"
                   "4 store or permission failure, 5 doctor has findings.");
}

Commands::~Commands() = default;

Command Commands::add(const std::string& strName, const std::string& strDescription, Run run, Needs needs)
{
    CLI::App& app = *m_pApp->add_subcommand(strName, strDescription);
    app.footer("");
    app.set_help_flag("-h,--help", "print this help and exit");
    app.set_version_flag("--version", VERSION_TEXT, "print the version and exit");
    app.add_flag("-v,--verbose", m_blVerbose, "show the library's log lines on standard error");
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
    try {
        m_pApp->parse(nArguments, rgArguments);
    } catch (const CLI::Success& help) { // --help or --version
        std::ostringstream text;
        m_pApp->exit(help, text, text);
        print(text.str());
        flushResult();
        return EXIT_STATUS_DONE;
    } catch (const CLI::ParseError& error) {
        throw Failure(EXIT_STATUS_USAGE, error.what());
    }
    if (!m_run) {
        throw Failure(EXIT_STATUS_USAGE, "say what to do; \"vemo-access-token --help\" lists the commands");
    }
    if (m_blVerbose) {
        showLogLines();
    }
    const int nStatus = m_run();
    flushResult();
    return nStatus;
}

} // namespace tool
