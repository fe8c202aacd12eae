// init: makes the directory, the file and the table before programs need them.

#include "AccessTokenDefine.h"
#include "Change.h"
#include "Commands.h"
#include "Console.h"
#include "Failure.h"
#include "Place.h"
#include "Signals.h"
#include "Store.h"

namespace {

struct Made {
    bool blFile;
    bool blTable;
};

Made makeStore()
{
    tool::Store store(tool::Store::Access::Locked, tool::Store::Missing::Make);
    const bool blFile = store.hasMadeFile();
    return {blFile, store.makeTable() || blFile}; // the library makes the table together with a missing file
}

int init()
{
    const tool::EndingPause pause; // from the first change to the line about all of them
    const bool blDirectory = tool::makeDirectory();
    if (blDirectory) {
        tool::settleChange();
        tool::print("made the directory " + tool::databaseDirectory() + "\n");
    }
    const Made made = makeStore();
    if (made.blFile) {
        tool::print("made the file " VEMO_ATOKEN_DB_PATH "\n");
    }
    if (made.blTable) {
        tool::print("made the table of tokens\n");
    } else if (!blDirectory) {
        tool::print("all was there already\n");
    }
    return tool::EXIT_STATUS_DONE;
}

} // namespace

namespace tool {

void addInit(Commands& commands)
{
    Command& command = commands.add(
        "init", "make the directory, the file and the table, so that no program's first call has to", init);
    command.example("");
    command.example("&& vemo-access-token doctor");
}

} // namespace tool
