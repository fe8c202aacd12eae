#include "PowerDisk.h"

#include <algorithm>

namespace {

const size_t CB_SECTOR = 512;
const size_t NO_INODE = 0;

void grow(std::string& strContents, size_t cb, const Outcome& outcome)
{
    if (strContents.size() < cb) {
        strContents.resize(cb, 0 == outcome(2) ? '\xA5' : '\0');
    }
}

// Applies the part of the write that lies between nFirst and nEnd of the file.
void put(std::string& strContents, const DiskCall& call, size_t nFirst, size_t nEnd, const Outcome& outcome)
{
    grow(strContents, nFirst, outcome);
    strContents.replace(nFirst, nEnd - nFirst, call.strData, nFirst - call.nOffset, nEnd - nFirst);
}

void putSomeSectors(std::string& strContents, const DiskCall& call, size_t nEnd, const Outcome& outcome)
{
    size_t nNext = 0;
    for (size_t nFirst = call.nOffset; nFirst < nEnd; nFirst = nNext) {
        nNext = std::min(nEnd, nFirst - nFirst % CB_SECTOR + CB_SECTOR);
        if (0 != outcome(2)) {
            put(strContents, call, nFirst, nNext, outcome);
        }
    }
}

void write(std::string& strContents, const DiskCall& call, const Outcome& outcome)
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

size_t asAskedFor(size_t n)
{
    return n - 1;
}

} // namespace

size_t onlySynced(size_t)
{
    return 0;
}

PowerDisk::PowerDisk(const Files& files, Order order) : m_order(order), m_inodes(1)
{
    for (const auto& [strName, strContents] : files) {
        m_directory[strName] = {{makeInode(strContents), 0}};
    }
}

size_t PowerDisk::makeInode(const std::string& strDurable)
{
    m_inodes.push_back({strDurable, {}});
    return m_inodes.size() - 1;
}

PowerDisk::Inode& PowerDisk::inodeOf(const std::string& strName)
{
    return m_inodes.at(m_directory.at(strName).back().nInode);
}

void PowerDisk::enter(const std::string& strName, size_t nInode)
{
    std::vector<Entry>& entries = m_directory[strName];
    if (entries.empty()) {
        entries.push_back({NO_INODE, 0});
    }
    entries.push_back({nInode, ++m_nNumber});
}

void PowerDisk::sync(Inode& inode)
{
    inode.strDurable = contentsAfter(inode, m_nNumber, &asAskedFor);
    for (const Change& change : inode.pending) {
        m_nDurable = std::max(m_nDurable, change.nNumber);
    }
    inode.pending.clear();
}

void PowerDisk::syncDirectory()
{
    for (auto& [strName, entries] : m_directory) {
        entries.erase(entries.begin(), entries.end() - 1);
        m_nDurable = std::max(m_nDurable, entries.back().nNumber);
    }
}

void PowerDisk::take(const DiskCall& call)
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

size_t PowerDisk::entryAfter(const std::vector<Entry>& entries, size_t nKept, const Outcome& outcome) const
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

std::string PowerDisk::contentsAfter(const Inode& inode, size_t nKept, const Outcome& outcome) const
{
    std::string strContents = inode.strDurable;
    for (const Change& change : inode.pending) {
        if (DiskCall::Kind::Write == change.call.kind) {
            write(strContents, change.call, outcome);
        } else if (Order::Lost == m_order ? 0 != outcome(2) : change.nNumber <= nKept) {
            strContents.resize(change.call.nOffset);
        }
    }
    return strContents;
}

size_t PowerDisk::pending() const
{
    size_t nPending = m_nNumber - m_nDurable;
    for (const Inode& inode : m_inodes) {
        nPending += inode.pending.size();
    }
    return nPending;
}

Files PowerDisk::afterPowerCut(const Outcome& outcome) const
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

Files PowerDisk::files() const
{
    return afterPowerCut(&asAskedFor);
}
