// The place of the database: its directory, its file, and the files beside it.

#ifndef TOOLS_PLACE_H
#define TOOLS_PLACE_H

#include <sys/stat.h>

#include <optional>
#include <string>

#include "Descriptor.h"

namespace tool {

// The private directory of the database, and the name of the database file in it.
std::string databaseDirectory();
std::string databaseName();

// Opens the private directory, also through symbolic links. Returns a closed Descriptor, with errno set, if
// that fails. Takes no memory.
Descriptor openDirectory();

// The suffixes of the database's journals.
const char* const JOURNAL_SUFFIXES[] = {"-journal", "-wal", "-shm"};

// The status of a path, as by lstat; nothing if there is no such file. Throws Failure.
std::optional<struct stat> statusOf(const std::string& strPath);

// The first or last bytes of the journal with this suffix; "" means the database itself. Bytes that the file
// does not have are zeros, and all are if it cannot be read or is not a regular file. Do not read the
// database's bytes while this process has it open: closing the file drops SQLite's locks.
std::string firstBytes(const std::string& strSuffix, size_t cbWanted);
std::string lastBytes(const std::string& strSuffix, size_t cbWanted);

// Whether another process is changing a database with a rollback journal now. Do not call this while this
// process has the database open, for the same reason.
bool isBeingChanged();

// Fails unless the database can be opened or, with blCreate, made.
void requireDatabase(bool blCreate);

// Makes the private directory, and the directories above it, if they are missing. Returns whether the private
// directory was made.
bool makeDirectory();

// Makes an empty database file if there is none. Returns whether it was made.
bool makeFile();

// Syncs the private directory. Fails with szMeaning, which says what a failure means. Takes no memory to
// sync, so that lack of memory cannot hide a change that was made.
void syncDirectory(const char* szMeaning);

// Fails unless the effective user is root.
void requireRoot();

} // namespace tool

#endif
