#include "plibc.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

int PLIBCFileTouch(const char* szPath)
{
    const int nFile = open(szPath, O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, S_IRUSR | S_IWUSR);
    if (0 > nFile) {
        struct stat status;
        return EEXIST == errno ? stat(szPath, &status) : -1;
    }
    close(nFile);
    return 0;
}
