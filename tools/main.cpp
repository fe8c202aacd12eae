// vemo-access-token: what the administrator of a machine does with its access tokens. It works through
// the library alone and never opens the database on its own.

#include <clocale>
#include <exception>
#include <new>

#include "Commands.h"
#include "Console.h"
#include "Failure.h"

namespace {

void addAll(tool::Commands& commands)
{
    tool::addCreate(commands);
    tool::addGenerate(commands);
    tool::addList(commands);
    tool::addShow(commands);
    tool::addCheck(commands);
    tool::addGrant(commands);
    tool::addUpdate(commands);
    tool::addRevoke(commands);
    tool::addPurge(commands);
    tool::addStats(commands);
    tool::addExport(commands);
    tool::addImport(commands);
    tool::addInit(commands);
    tool::addDoctor(commands);
    tool::addTune(commands);
}

} // namespace

int main(int nArguments, char** rgArguments)
{
    try {
        tool::completeStreams();
        setlocale(LC_CTYPE, ""); // how wide characters are
        tool::Commands commands;
        addAll(commands);
        return commands.run(nArguments, rgArguments);
    } catch (const tool::Failure& failure) {
        tool::complain(failure.what());
        return failure.status();
    } catch (const std::bad_alloc&) {
        tool::complain("out of memory");
    } catch (const std::exception& exception) {
        tool::complain(exception.what());
    }
    return tool::EXIT_STATUS_STORE;
}
