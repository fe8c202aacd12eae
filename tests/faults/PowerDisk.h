// A disk that loses power: what it may hold then, given what was asked of it.
//
// A sync makes the contents of a file durable, a sync of the directory its entries. Until then each write is
// lost, kept or torn, whatever becomes of those before and after it, and a file that grows may hold anything
// where nothing was written. A write changes no byte outside of its range, which is what SQLite's "unix" VFS
// promises of the disk (SQLITE_IOCAP_POWERSAFE_OVERWRITE), and all that it promises.
//
// File systems with a journal of their own keep the order of what is no write, that is of creations, unlinks
// and truncations: what is lost of them is the last ones. Others lose any of them.

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

// Picks one of n outcomes: 0 is the oldest, n - 1 what was asked for last.
typedef std::function<size_t(size_t n)> Outcome;

// All is lost that was not synced.
size_t onlySynced(size_t n);

class PowerDisk {
public:
    // All of this is durable.
    PowerDisk(const Files& files, Order order);

    void take(const DiskCall& call);

    // How much a power cut may undo.
    size_t pending() const;

    Files afterPowerCut(const Outcome& outcome) const;

    // As programs see it.
    Files files() const;

private:
    // Numbers count the calls that are no writes.
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
