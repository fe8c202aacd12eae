// Other processes, from /proc: who holds a lock, and who has the database open. Needs root.

#ifndef TOOLS_PROCESSES_H
#define TOOLS_PROCESSES_H

#include <string>
#include <vector>

namespace tool {

// Who holds a lock on a file, such as "vpnd (process 4711)"; "another process" if that is not known.
std::string lockHolders(const std::string& strFile);

// Whether /proc is mounted.
bool canSeeProcesses();

// The descriptors by which other processes have the database open, as paths in /proc; and whether such a path
// still leads to the database. The first throws Failure.
std::vector<std::string> databaseDescriptors();
bool isOfDatabase(const std::string& strDescriptor);

// The processes that own such descriptors, each named once.
std::string ownersText(const std::vector<std::string>& strDescriptors);

} // namespace tool

#endif
