// Where the database stands: its directory, its file and what belongs beside it.

#ifndef TOOLS_PLACE_H
#define TOOLS_PLACE_H

#include <sys/stat.h>

#include <optional>
#include <string>

#include "Descriptor.h"

namespace tool {

// The private directory that holds the database, and the name of that in it.
std::string databaseDirectory();
std::string databaseName();

// Opens that directory, whatever the way to it; none, with errno set, where that is not possible. Takes no
// memory.
Descriptor openDirectory();

// What stands behind that in the names of its journals.
const char* const JOURNAL_SUFFIXES[] = {"-journal", "-wal", "-shm"};

// What lstat tells of a path; nothing when there is no such file. Throws Failure.
std::optional<struct stat> statusOf(const std::string& strPath);

// The first and the last bytes of the database, or of the journal with this suffix; zeros where there are
// none, it cannot be read or is no regular file. Those of the database not while this process has it
// open: its locks would be lost.
std::string firstBytes(const std::string& strSuffix, size_t cbWanted);
std::string lastBytes(const std::string& strSuffix, size_t cbWanted);

// Whether another process is just changing the database with a rollback journal. Not while this process has
// it open, either.
bool isBeingChanged();

// Fails, with the reason, unless the database can be opened, or made if blCreate.
void requireDatabase(bool blCreate);

// Makes the private directory, and those above it, where they are missing. Returns whether it was
// made.
bool makeDirectory();

// Makes the file of the database, empty, where it is missing. Returns whether it was made.
bool makeFile();

// Waits until the disk has the directory as it is now. Fails, and says what that means. Takes no memory: a
// change that has been made must not be lost sight of for want of some.
void syncDirectory(const char* szMeaning);

// What commands that need root say to others; fails for them.
void requireRoot();

} // namespace tool

#endif
