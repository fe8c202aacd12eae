// The grants that one transaction makes.

#ifndef GATE_BATCH_H
#define GATE_BATCH_H

#include <functional>
#include <optional>
#include <string>
#include <unordered_map>

#include "Messages.h"
#include "Owners.h"
#include "grant/Tokens.h"

namespace gate {

class Batch {
public:
    // For use within a transaction. fOwner returns what is known of a user. Both must outlive the batch.
    Batch(grant::Tokens& tokens, const std::function<Owners::Owner(uid_t)>& fOwner)
        : m_tokens(tokens), m_fOwner(fOwner)
    {
    }

    // Decides on a call, and notes the use that it spends. Returns nothing while the owner's name is not
    // known: the call stays open, and spends nothing. Later calls of a token see the uses that earlier ones
    // left.
    std::optional<Reply> call(const Request& request);

    // Writes the uses that were spent, once for each token.
    void save();

    // Counts the decisions: GRANTED to FAILED. To be added up when the transaction is committed.
    const Figures& figures() const { return m_figures; }

private:
    struct Entry {
        std::optional<grant::Token> token; // with the uses that are left
        bool blChanged = false;
        bool blSpent = false; // its last use was spent
    };

    Reply refused(const Request& request, Figure figure);

    grant::Tokens& m_tokens;
    const std::function<Owners::Owner(uid_t)>& m_fOwner;
    std::unordered_map<std::string, Entry> m_entries;
    Figures m_figures = {};
};

} // namespace gate

#endif
