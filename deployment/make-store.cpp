// Makes the token database and its table if they are missing. The package of the library runs it before any
// program makes its first call: if several made theirs at once, some could fail and be lost.

#include <AccessTokenUtil.h>
#include <internal/AccessTokenDbApi.h>

#include <cstdlib>

int main()
{
    VEMO_ACCESS_TOKEN::logToStdout(true);
    AccessTokenDbApi store;
    const bool blMade = 0 <= store.initDb() && 0 <= store.createTable();
    return blMade ? EXIT_SUCCESS : EXIT_FAILURE;
}
