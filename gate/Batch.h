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
    // Within a transaction. fOwner tells what is known of a user; both must outlive the batch.
    Batch(grant::Tokens& tokens, const std::function<Owners::Owner(uid_t)>& fOwner)
        : m_tokens(tokens), m_fOwner(fOwner)
    {
    }

    // Decides on a call, and remembers the use that it spends. Nothing while the owner's name is not known:
    // the call stays open, and nothing is spent. The calls of one token see what those ahead of them have
    // left.
    std::optional<Answer> call(const Request& request);

    // Writes what has been spent, each token once.
    void save();

    // What has been decided, of the figures from GRANTED to REFUSED_LARGE; for when the transaction lasts.
    const Figures& figures() const { return m_figures; }

private:
    struct Entry {
        std::optional<grant::Token> token; // with the uses that are left so far
        bool blChanged = false;
        bool blSpent = false; // its last use
    };

    Answer refused(const Request& request, Figure figure);

    grant::Tokens& m_tokens;
    const std::function<Owners::Owner(uid_t)>& m_fOwner;
    std::unordered_map<std::string, Entry> m_entries;
    Figures m_figures = {};
};

} // namespace gate

#endif
