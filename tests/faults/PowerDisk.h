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

#include <functional>
#include <map>
#include <string>
#include <vector>

#include "TokenStore.h"

struct DiskCall {
    enum class Kind { Create, Write, Truncate, Unlink, Sync, SyncDirectory, Return };
    Kind kind; // Return: the library returned to its caller; the disk hears nothing of that
    std::string strName = "";
    size_t nOffset = 0; // of Write; of Truncate the new size
    std::string strData = "";
};

enum class Order { Kept, Lost };

// Picks one of n outcomes: from 0, the oldest, to n - 1, what was requested last.
typedef std::function<size_t(size_t n)> Outcome;

// Picks the oldest: everything that was not synced is lost.
size_t onlySynced(size_t n);

class PowerDisk {
public:
    // A disk with these files, all durable.
    PowerDisk(const Files& files, Order order);

    void take(const DiskCall& call);

    // The number of changes that a power cut may undo.
    size_t pending() const;

    Files afterPowerCut(const Outcome& outcome) const;

    // The files as programs see them.
    Files files() const;

private:
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
    size_t makeInode(const std::string& strDurable);
    Inode& inodeOf(const std::string& strName);
    void enter(const std::string& strName, size_t nInode);
    void sync(Inode& inode);
    void syncDirectory();
    size_t entryAfter(const std::vector<Entry>& entries, size_t nKept, const Outcome& outcome) const;
    std::string contentsAfter(const Inode& inode, size_t nKept, const Outcome& outcome) const;

    Order m_order;
    std::vector<Inode> m_inodes;
    std::map<std::string, std::vector<Entry>> m_directory; // by name, since the last sync of the directory
    size_t m_nNumber = 0;
    size_t m_nDurable = 0; // where the order is kept, that and all before cannot be lost
};

#endif
