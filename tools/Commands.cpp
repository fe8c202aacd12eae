#include "Commands.h"

#include "Console.h"
#include "Failure.h"
#include "Place.h"

namespace {

const char* const VERSION_TEXT = "vemo-access-token " VEMO_ATOKEN_VERSION;

} // namespace

namespace tool {

Commands::Commands() : m_app("Administers the access tokens of this machine.", "vemo-access-token")
{
    m_app.set_help_flag("-h,--help", "print this help and exit");
    m_app.set_version_flag("--version", VERSION_TEXT, "print the version and exit");
    m_app.require_subcommand(0, 1);
    m_app.footer("\"vemo-access-token COMMAND --help\" tells more, and so does vemo-access-token(8).\n\n"
                 "Exit status: 0 done or granted, 1 refused (grant, check), 2 usage, 3 no such token,\n"
                 "4 store or permission failure, 5 doctor has findings.");
}

CLI::App& Commands::add(const std::string& strName, const std::string& strDescription, Run run, Needs needs)
{
    CLI::App& command = *m_app.add_subcommand(strName, strDescription);
    command.footer("");
    command.set_help_flag("-h,--help", "print this help and exit");
    command.set_version_flag("--version", VERSION_TEXT, "print the version and exit");
    command.add_flag("-v,--verbose", m_blVerbose, "show the library's log lines on standard error");
    command.callback([this, run, needs] {
        m_run = [run, needs] {
            if (Needs::Root == needs) {
                requireRoot();
            }
            return run();
        };
    });
    return command;
}

int Commands::run(int nArguments, char** rgArguments)
{
    try {
        m_app.parse(nArguments, rgArguments);
    } catch (const CLI::Success& help) { // --help or --version
        std::ostringstream text;
        m_app.exit(help, text, text);
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
