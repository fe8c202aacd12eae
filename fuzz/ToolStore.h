// The store that the tool uses, with the same tokens before each run.

#ifndef FUZZ_TOOL_STORE_H
#define FUZZ_TOOL_STORE_H

#include <json/value.h>

#include <memory>
#include <string>
#include <vector>

#include "Commands.h"

struct sqlite3;

namespace fuzz {

// Runs the tool with these arguments; the first is the name of the program. Returns its exit status.
// Exceptions other than tool::Failure pass through, and end the fuzzing.
int runTool(tool::Commands& commands, std::vector<std::string> strArguments);

class ToolStore {
public:
    ToolStore();
    ToolStore(const ToolStore&) = delete;
    ToolStore& operator=(const ToolStore&) = delete;

    // Whether the database differs from its first state.
    bool isChanged() const;

    // Its tokens. The database must be sound.
    Json::Value tokens() const;

    // Restores its first state.
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

// Standard input for the tool, as long as the object lives.
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
