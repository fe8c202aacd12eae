// A run of the tool in its own process, in which the system fails or kills it where a test demands that.

#ifndef TESTS_TOOL_TOOL_RUN_H
#define TESTS_TOOL_TOOL_RUN_H

#include <cstdint>
#include <string>
#include <vector>

// What happens to the calls nFirst to nLast of those that it can happen to.
struct Fault {
    enum class Kind {
        Error,    // a system call on a file fails
        FullDisk, // a system call that takes room on the disk fails
        Signal,   // the process gets a signal before a system call on a file
        Memory,   // an allocation fails
    };
    Kind kind = Kind::Error;
    int64_t nFirst = 0;
    int64_t nLast = -1;
    int nSignal = 0;
};

struct Ending {
    int nSignal = 0; // that killed it
    int nStatus = 0;
    std::string strOutput;
    std::string strError;
    int64_t nCalls = 0; // that the fault could happen to
};

// Whether the kernel lets one process answer the system calls of another. Otherwise the tool cannot be run.
bool canRunTool();

// Nothing waits for the disk. With VEMO_TEST_NO_TMPFILE, the file system has no files without a name.
Ending runTool(const std::vector<std::string>& strArguments, const Fault& fault = {});

#endif
