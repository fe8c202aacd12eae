// What the code under test may do to the machine: nothing.
//
// While a Confinement lives, the process seems to be root's, and the private directory seems to be there,
// with a database that stands in memory. Two files can be read, EXTRA_FILE and TOKENS_FILE; files that are
// made vanish. Log lines are written out and dropped. Users are root, and anna with uid 1000.

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

// The database in memory that sqlite3_open opens for the code under test. It lasts as long as a connection.
sqlite3* openStore();

// Gives this connection to the next caller of sqlite3_open instead.
void offer(sqlite3* pDb);

// The text of both files.
void setFileTexts(const std::string& strExtra, const std::string& strTokens);

// From captureStreams on, which is to be called once while confined, the streams of the tool are kept: what
// it wrote to each since the last call.
void captureStreams();
std::string takeResult();
std::string takeComplaints();

} // namespace fuzz

#endif
