// The store that the tool finds: some tokens, the same ahead of each run.

#ifndef FUZZ_TOOL_STORE_H
#define FUZZ_TOOL_STORE_H

#include <json/value.h>

#include <memory>
#include <string>
#include <vector>

#include "Commands.h"

struct sqlite3;

namespace fuzz {

// Runs the tool with these arguments, the name of the program being the first, and returns its exit status.
// What main() would take for a failure of the system ends the fuzzing.
int runTool(tool::Commands& commands, std::vector<std::string> strArguments);

class ToolStore {
public:
    ToolStore();
    ToolStore(const ToolStore&) = delete;
    ToolStore& operator=(const ToolStore&) = delete;

    // Whether a byte of the database is another than at first.
    bool isChanged() const;

    // Its tokens. Fails unless all can be read and the database is sound.
    Json::Value tokens() const;

    // Makes it as it was at first.
    void restore();

    // Deletes all tokens.
    void clear();

private:
    std::string image() const;
    void run(const char* szSql) const;

    sqlite3* const m_pDb; // it keeps the database alive
    sqlite3* m_pFirst;    // a copy
    std::string m_strImage;
};

// Gives the tool a text on standard input while it lives.
class Input {
public:
    explicit Input(const std::string& strText);
    ~Input();
    Input(const Input&) = delete;
    Input& operator=(const Input&) = delete;

private:
    const std::unique_ptr<std::streambuf> m_pText;
    std::streambuf* const m_pBefore;
};

} // namespace fuzz

#endif
