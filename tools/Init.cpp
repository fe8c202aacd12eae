// init: makes the directory, the file and the table before programs need them.

#include "AccessTokenDefine.h"
#include "Commands.h"
#include "Console.h"
#include "Failure.h"
#include "Place.h"
#include "Store.h"

namespace {

int init()
{
    const bool blDirectory = tool::makeDirectory();
    const bool blFile = !tool::statusOf(VEMO_ATOKEN_DB_PATH);
    tool::Store store(tool::Store::Access::Plain, tool::Store::Missing::Make);
    bool blTable = blFile; // made with it
    if (!store.hasTable()) {
        store.makeTable();
        blTable = true;
    }
    if (blDirectory || blFile) {
        tool::Store::settleChange();
    }
    if (blDirectory) {
        tool::print("made the directory " + tool::databaseDirectory() + "\n");
    }
    if (blFile) {
        tool::print("made the file " VEMO_ATOKEN_DB_PATH "\n");
    }
    tool::print(blTable ? "made the table of tokens\n" : "all was there already\n");
    return tool::EXIT_STATUS_DONE;
}

} // namespace

namespace tool {

void addInit(Commands& commands)
{
    commands.add("init", "make the directory, the file and the table, so that no program's first call has to",
                 init);
}

} // namespace tool
