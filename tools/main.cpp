// vemo-access-token, the tool by which an administrator manages the access tokens of a machine.

#include <json/value.h>
#include <unistd.h>

#include <clocale>
#include <cstdlib>
#include <exception>
#include <new>

#include "Commands.h"
#include "Console.h"
#include "Failure.h"

namespace {

// For exceptions that no handler catches: there was no memory for the handler, or for the exception.
void endWithoutMemory()
{
    try {
        if (std::current_exception()) {
            throw;
        }
    } catch (const std::bad_alloc&) {
        // Memory ran out as well.
    } catch (...) {
        abort();
    }
    tool::complainOfMemory();
    _exit(tool::EXIT_STATUS_STORE);
}

} // namespace

int main(int nArguments, char** rgArguments)
{
    std::set_terminate(endWithoutMemory);
    try {
        tool::completeStreams();
        setlocale(LC_CTYPE, ""); // for the character set and the widths of characters
        tool::Commands commands;
        for (const tool::CommandEntry& entry : tool::COMMANDS) {
            entry.add(commands);
        }
        return commands.run(nArguments, rgArguments);
    } catch (const tool::Failure& failure) {
        tool::complain(failure.what());
        return failure.status();
    } catch (const std::bad_alloc&) {
        tool::complainOfMemory();
    } catch (const Json::RuntimeError&) { // how jsoncpp reports lack of memory
        tool::complainOfMemory();
    } catch (const std::exception& exception) {
        tool::complain(exception.what());
    }
    return tool::EXIT_STATUS_STORE;
}
