// For tests of locks: each time the library waits for a locked database, a line goes into the file, as a rule
// a fifo, that VEMO_TEST_WAITS names. Whoever holds the lock can let go just then. With VEMO_TEST_HASTE,
// waiting takes no time.

#include <dlfcn.h>
#include <fcntl.h>
#include <unistd.h>

#include <cstdlib>

extern "C" __attribute__((visibility("default"))) int usleep(useconds_t nMicroseconds)
{
    static const auto next = reinterpret_cast<decltype(&::usleep)>(dlsym(RTLD_NEXT, "usleep"));
    const char* szFile = getenv("VEMO_TEST_WAITS");
    const int nFile = szFile ? open(szFile, O_WRONLY | O_NONBLOCK | O_CLOEXEC) : -1;
    if (0 <= nFile) {
        [[maybe_unused]] const ssize_t nWritten = write(nFile, "\n", 1);
        close(nFile);
    }
    return getenv("VEMO_TEST_HASTE") ? 0 : next(nMicroseconds);
}
