// Ids of tokens in an order. They stand in a file without a name, for a million of them take more memory than
// the tool may, and it is in the private directory, for they are credentials.

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
        std::string strTid; // as SQL
        int64_t nRow;
    };

    // Takes an id, and what it is sorted by: a number or a text. Equals come by their rows.
    void add(const Id& id, const std::string& strKey, bool blNumber);

    // Hands them out in their order, the first nLimit of them, in groups.
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
