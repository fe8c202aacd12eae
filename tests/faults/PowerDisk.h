// A simulated disk: what it may hold after a power cut.
//
// A sync of a file makes its contents durable; a sync of the directory makes its entries durable. Until then,
// each write may be lost, kept or torn, independently of all others, and a file that has grown may hold any
// bytes where nothing was written. A write never changes bytes outside of its range: SQLite's "unix" VFS
// relies on that (SQLITE_IOCAP_POWERSAFE_OVERWRITE), and on nothing else.
//
// File systems with a journal keep the order of creations, unlinks and truncations: a power cut loses the
// last of them. Other file systems may lose any of them.

#ifndef TESTS_POWER_DISK_H
#define TESTS_POWER_DISK_H

#include <algorithm>
#include <functional>
#include <map>
#include <string>
#include <vector>

#include "TokenStore.h"

struct DiskCall {
    enum class Kind { Create, Write, Truncate, Unlink, Sync, SyncDirectory, Return };
    Kind kind; // Return: the library returned to its caller, which the disk does not see
    std::string strName = "";
    size_t nOffset = 0; // of Write; of Truncate the new size
    std::string strData = "";
};

enum class Order { Kept, Lost };

// Picks one of n outcomes: from 0, the oldest, to n - 1, what was requested last.
typedef std::function<size_t(size_t n)> Outcome;

const Outcome ONLY_SYNCED = [](size_t) -> size_t { return 0; };
const Outcome AS_ASKED_FOR = [](size_t n) { return n - 1; };

class PowerDisk {
public:
    // A disk with these files, all durable.
    PowerDisk(const Files& files, Order order) : m_order(order), m_inodes(1)
    {
        for (const auto& [strName, strContents] : files) {
            m_directory[strName] = {{makeInode(strContents), 0}};
        }
    }

    void take(const DiskCall& call)
    {
        switch (call.kind) {
        case DiskCall::Kind::Create: enter(call.strName, makeInode("")); break;
        case DiskCall::Kind::Unlink: enter(call.strName, NO_INODE); break;
        case DiskCall::Kind::Write: inodeOf(call.strName).pending.push_back({call, 0}); break;
        case DiskCall::Kind::Truncate: inodeOf(call.strName).pending.push_back({call, ++m_nNumber}); break;
        case DiskCall::Kind::Sync: sync(inodeOf(call.strName)); break;
        case DiskCall::Kind::SyncDirectory: syncDirectory(); break;
        case DiskCall::Kind::Return: break;
        }
    }

    // The number of changes that a power cut may undo.
    size_t pending() const
    {
        size_t nPending = m_nNumber - m_nDurable;
        for (const Inode& inode : m_inodes) {
            nPending += inode.pending.size();
        }
        return nPending;
    }

    Files afterPowerCut(const Outcome& outcome) const
    {
        const size_t nKept = m_nDurable + outcome(m_nNumber - m_nDurable + 1);
        Files files;
        for (const auto& [strName, entries] : m_directory) {
            const size_t nInode = entryAfter(entries, nKept, outcome);
            if (NO_INODE != nInode) {
                files[strName] = contentsAfter(m_inodes[nInode], nKept, outcome);
            }
        }
        return files;
    }

    // The files as programs see them.
    Files files() const { return afterPowerCut(AS_ASKED_FOR); }

private:
    static constexpr size_t CB_SECTOR = 512;
    static constexpr size_t NO_INODE = 0;

    // nNumber counts all calls but writes.
    struct Change {
        DiskCall call;
        size_t nNumber;
    };
    struct Inode {
        std::string strDurable;
        std::vector<Change> pending;
    };
    struct Entry {
        size_t nInode;
        size_t nNumber;
    };

    size_t makeInode(const std::string& strDurable)
    {
        m_inodes.push_back({strDurable, {}});
        return m_inodes.size() - 1;
    }

    Inode& inodeOf(const std::string& strName) { return m_inodes.at(m_directory.at(strName).back().nInode); }

    void enter(const std::string& strName, size_t nInode)
    {
        std::vector<Entry>& entries = m_directory[strName];
        if (entries.empty()) {
            entries.push_back({NO_INODE, 0});
        }
        entries.push_back({nInode, ++m_nNumber});
    }

    void sync(Inode& inode)
    {
        inode.strDurable = contentsAfter(inode, m_nNumber, AS_ASKED_FOR);
        for (const Change& change : inode.pending) {
            m_nDurable = std::max(m_nDurable, change.nNumber);
        }
        inode.pending.clear();
    }

    void syncDirectory()
    {
        for (auto& [strName, entries] : m_directory) {
            entries.erase(entries.begin(), entries.end() - 1);
            m_nDurable = std::max(m_nDurable, entries.back().nNumber);
        }
    }

    size_t entryAfter(const std::vector<Entry>& entries, size_t nKept, const Outcome& outcome) const
    {
        if (Order::Lost == m_order) {
            return entries[outcome(entries.size())].nInode;
        }
        size_t nInode = entries.front().nInode;
        for (const Entry& entry : entries) {
            nInode = entry.nNumber <= nKept ? entry.nInode : nInode;
        }
        return nInode;
    }

    std::string contentsAfter(const Inode& inode, size_t nKept, const Outcome& outcome) const
    {
        std::string strContents = inode.strDurable;
        for (const auto& [call, nNumber] : inode.pending) {
            if (DiskCall::Kind::Write == call.kind) {
                write(strContents, call, outcome);
            } else if (Order::Lost == m_order ? 0 != outcome(2) : nNumber <= nKept) {
                strContents.resize(call.nOffset);
            }
        }
        return strContents;
    }

    static void write(std::string& strContents, const DiskCall& call, const Outcome& outcome)
    {
        enum { LOST, GROWN, TORN_IN_A_SECTOR, TORN, KEPT, OUTCOMES };
        const size_t nEnd = call.nOffset + call.strData.size();
        switch (outcome(OUTCOMES)) {
        case LOST: break;
        case GROWN: grow(strContents, nEnd, outcome); break;
        case TORN_IN_A_SECTOR:
            put(strContents, call, call.nOffset, call.nOffset + outcome(call.strData.size()), outcome);
            break;
        case TORN: putSomeSectors(strContents, call, nEnd, outcome); break;
        default: put(strContents, call, call.nOffset, nEnd, outcome); break;
        }
    }

    static void grow(std::string& strContents, size_t cb, const Outcome& outcome)
    {
        if (strContents.size() < cb) {
            strContents.resize(cb, 0 == outcome(2) ? '\xA5' : '\0');
        }
    }

    // Applies the part of the write that lies between nFirst and nEnd of the file.
    static void put(std::string& strContents, const DiskCall& call, size_t nFirst, size_t nEnd,
                    const Outcome& outcome)
    {
        grow(strContents, nFirst, outcome);
        strContents.replace(nFirst, nEnd - nFirst, call.strData, nFirst - call.nOffset, nEnd - nFirst);
    }

    static void putSomeSectors(std::string& strContents, const DiskCall& call, size_t nEnd,
                               const Outcome& outcome)
    {
        size_t nNext = 0;
        for (size_t nFirst = call.nOffset; nFirst < nEnd; nFirst = nNext) {
            nNext = std::min(nEnd, nFirst - nFirst % CB_SECTOR + CB_SECTOR);
            if (0 != outcome(2)) {
                put(strContents, call, nFirst, nNext, outcome);
            }
        }
    }

    Order m_order;
    std::vector<Inode> m_inodes;
    std::map<std::string, std::vector<Entry>> m_directory; // by name, since the last sync of the directory
    size_t m_nNumber = 0;
    size_t m_nDurable = 0; // if the order is kept, this one and all before it cannot be lost
};

#endif
