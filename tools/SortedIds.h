// Sorts the ids of tokens. They are kept in a temporary file, because a million ids take more memory than the
// tool may use. The file has no name and is in the private directory, because ids are credentials. If that
// directory cannot be written to, the ids are sorted in memory.

#ifndef TOOLS_SORTED_IDS_H
#define TOOLS_SORTED_IDS_H

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "grant/Tokens.h"

struct sqlite3;

namespace tool {

// Members throw Failure.
class SortedIds {
public:
    explicit SortedIds(bool blDescending);

    struct Id {
        std::string strTid; // as an SQL literal
        int64_t nRow;
    };

    // Takes an id and its sort key, a number or a text. Ids with equal keys are in the order of their rows.
    void add(const Id& id, const std::string& strKey, bool blNumber);

    // Calls use() with the first nLimit ids in order, in groups.
    void each(uint64_t nLimit, const std::function<void(const std::vector<Id>& ids)>& use);

private:
    template <typename Run>
    void run(Run run);

    const std::unique_ptr<sqlite3, int (*)(sqlite3*)> m_pDb;
    const bool m_blDescending;
    std::optional<grant::Statement> m_insert;
};

} // namespace tool

#endif
