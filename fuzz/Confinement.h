// What the code under test may do to the machine: nothing.
//
// While a Confinement lives, the process believes that it is root's and that the private directory exists;
// the database is in memory. Two files can be read, EXTRA_FILE and TOKENS_FILE; new files vanish. The clock,
// the users and the log are those of tests/model/World.h.

#ifndef FUZZ_CONFINEMENT_H
#define FUZZ_CONFINEMENT_H

#include <string>

struct sqlite3;

namespace fuzz {

extern const char* const EXTRA_FILE;  // a JSON object
extern const char* const TOKENS_FILE; // a token as a line of JSON

class Confinement {
public:
    Confinement();
    ~Confinement();
    Confinement(const Confinement&) = delete;
    Confinement& operator=(const Confinement&) = delete;
};

// Opens the database in memory that the code under test gets from sqlite3_open. It lasts as long as any
// connection.
sqlite3* openStore();

// Gives this connection to the next caller of sqlite3_open instead.
void offer(sqlite3* pDb);

// The text of both files.
void setFileTexts(const std::string& strExtra, const std::string& strTokens);

// captureStreams() is called once, while confined. From then on the other two return what the tool has
// written to standard output and standard error since their last call.
void captureStreams();
std::string takeResult();
std::string takeComplaints();

} // namespace fuzz

#endif
