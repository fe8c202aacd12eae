// Where the database stands: its directory, its file and what belongs beside it.

#ifndef TOOLS_PLACE_H
#define TOOLS_PLACE_H

#include <sys/stat.h>

#include <optional>
#include <string>

namespace tool {

// The private directory that holds the database.
std::string databaseDirectory();

// What lstat tells of a path; nothing when there is no such file. Throws Failure.
std::optional<struct stat> statusOf(const std::string& strPath);

// The first bytes of a file, as many as there are; none where it cannot be read.
std::string firstBytes(const std::string& strPath, size_t cbWanted);

// Fails, with the reason, unless the database can be opened, or made if blCreate.
void requireDatabase(bool blCreate);

// Makes the private directory, and those above it, where they are missing. Returns whether it was
// made.
bool makeDirectory();

// Waits until the disk has the directory as it is now, after a change. Fails, and says what that means.
void syncDirectory();

// What commands that need root say to others; fails for them.
void requireRoot();

} // namespace tool

#endif
