// For programs that replace functions of the libraries that they use.

#ifndef TESTS_INTERPOSE_H
#define TESTS_INTERPOSE_H

#include <dlfcn.h>

// Makes a definition visible to the libraries, which then call it.
#define INTERPOSED __attribute__((visibility("default")))

// The function of that name that would run if the program did not define it; looked up once.
#define NEXT(name)                                                                                           \
    ([] {                                                                                                    \
        static const auto pNext = reinterpret_cast<decltype(&::name)>(dlsym(RTLD_NEXT, #name));              \
        return pNext;                                                                                        \
    }())

#endif
