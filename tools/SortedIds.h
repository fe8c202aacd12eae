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

    // Takes an id, as SQL, and what it is sorted by: a number or a text. Equals come by the second number.
    void add(const std::string& strTid, const std::string& strKey, bool blNumber, int64_t nOfEquals);

    // Hands them out in their order, the first nLimit of them, in groups.
    void each(uint64_t nLimit, const std::function<void(const std::vector<std::string>& strTids)>& use);

private:
    template <typename Run>
    void run(Run run);

    const std::unique_ptr<sqlite3, int (*)(sqlite3*)> m_pDb;
    const bool m_blDescending;
    std::optional<grant::Statement> m_insert;
};

} // namespace tool

#endif
