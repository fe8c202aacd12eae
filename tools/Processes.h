// Other processes, as root sees them in /proc: who holds the lock, and who has the database open.

#ifndef TOOLS_PROCESSES_H
#define TOOLS_PROCESSES_H

#include <string>
#include <vector>

namespace tool {

// Who holds a lock of flock(2) on a file: "vpnd (process 4711)"; "another process" where nobody is known.
std::string lockHolders(const std::string& strFile);

// Whether /proc tells of processes.
bool canSeeProcesses();

// The descriptors that other processes have of the database, as paths in /proc; and whether one still is
// that. The first throws Failure.
std::vector<std::string> databaseDescriptors();
bool isOfDatabase(const std::string& strDescriptor);

// The processes that some such descriptors belong to, each named once.
std::string ownersText(const std::vector<std::string>& strDescriptors);

} // namespace tool

#endif
