// The structure of the database: the table of tokens, its indexes and triggers, the journal and the pages.

#ifndef TOOLS_SCHEMA_H
#define TOOLS_SCHEMA_H

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "Store.h"

namespace tool {

// Members throw Failure.
class Schema : public Store {
public:
    using Store::Store;

    // The statement that made the table of tokens.
    std::string tableStatement();

    bool hasColumn(const std::string& strName);
    bool hasIndex(const std::string& strName);

    // Whether an index begins with this column.
    bool isIndexed(const std::string& strColumn);

    // The names of the triggers on the table of tokens; and of its indexes that somebody made and that do
    // more than list columns.
    std::vector<std::string> triggers();
    std::vector<std::string> oddIndexes();

    // Such as "UTF-8"; and such as "delete" or "wal".
    std::string encoding();
    std::string journal();

    struct Pages {
        uint64_t nFree;
        uint64_t nBytes; // of one page
    };
    Pages pages();

    // Checks the whole file, which takes some seconds for a million tokens. Returns what is damaged, or "".
    // Without a write-ahead journal others cannot commit in that time; then this stops after longest, and
    // returns nothing.
    std::optional<std::string> damage(std::chrono::milliseconds longest);

    // Runs a statement that changes the structure. Returns its first value, or "".
    std::string run(const std::string& strStatement) { return text(strStatement); }

    // Writes what is there already, which costs as much as any small change.
    void writeSame();

private:
    std::vector<std::string> names(const std::string& strQuery);
};

} // namespace tool

#endif
