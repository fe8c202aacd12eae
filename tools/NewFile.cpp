#include "NewFile.h"

#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "Failure.h"
#include "Masking.h"
#include "Place.h"

namespace {

const int ENDING_SIGNALS[] = {SIGHUP, SIGINT, SIGQUIT, SIGTERM, SIGXFSZ};

std::atomic<const char*> g_szTemporary = nullptr; // that a signal removes

void removeTemporary()
{
    const char* szTemporary = g_szTemporary.exchange(nullptr);
    if (szTemporary) {
        unlink(szTemporary);
    }
}

// Handles a signal once; its second coming does what it does by default.
void removeAndEnd(int nSignal)
{
    removeTemporary();
    raise(nSignal);
}

// Those that are ignored stay so.
void handleSignals()
{
    for (const int nSignal : ENDING_SIGNALS) {
        struct sigaction action = {};
        if (0 == sigaction(nSignal, nullptr, &action) && SIG_DFL == action.sa_handler) {
            action.sa_handler = removeAndEnd;
            action.sa_flags = static_cast<int>(SA_RESETHAND);
            sigaction(nSignal, &action, nullptr);
        }
    }
}

// Holds signals up while a file comes or goes.
class SignalPause {
public:
    SignalPause()
    {
        sigset_t all;
        sigfillset(&all);
        sigprocmask(SIG_BLOCK, &all, &m_before);
    }
    ~SignalPause() { sigprocmask(SIG_SETMASK, &m_before, nullptr); }
    SignalPause(const SignalPause&) = delete;
    SignalPause& operator=(const SignalPause&) = delete;

private:
    sigset_t m_before;
};

} // namespace

namespace tool {

NewFile::TemporaryName::~TemporaryName()
{
    removeTemporary();
}

int NewFile::TemporaryName::make()
{
    handleSignals();
    const SignalPause pause;
    const int nFile = mkstemp(m_strPath.data());
    if (0 <= nFile) {
        g_szTemporary = m_strPath.c_str();
    }
    return nFile;
}

bool NewFile::TemporaryName::become(const std::string& strName)
{
    const SignalPause pause;
    if (0 != rename(m_strPath.c_str(), strName.c_str())) {
        return false;
    }
    g_szTemporary = nullptr;
    return true;
}

NewFile::NewFile(const std::string& strName) : m_strName(strName), m_temporary(strName)
{
    const auto status = statusOf(strName);
    if (status && !S_ISREG(status->st_mode)) {
        throw Failure(EXIT_STATUS_USAGE,
                      shownPath(strName) +
                          " is no regular file; to write to a pipe, write to standard output");
    }
    const int nFile = m_temporary.make();
    m_pStream = 0 > nFile ? nullptr : fdopen(nFile, "w");
    // The umask may have taken bits away.
    if (!m_pStream || 0 != fchmod(nFile, S_IRUSR | S_IWUSR)) {
        fail();
    }
}

NewFile::~NewFile()
{
    if (m_pStream) {
        fclose(m_pStream);
    }
}

void NewFile::write(const std::string& strText)
{
    fwrite(strText.data(), 1, strText.size(), m_pStream);
}

void NewFile::complete()
{
    if (0 != fflush(m_pStream) || ferror(m_pStream) || 0 != fsync(fileno(m_pStream)) ||
        !m_temporary.become(m_strName)) {
        fail();
    }
}

void NewFile::fail() const
{
    throw Failure(EXIT_STATUS_STORE, shownPath(m_strName) + ": " + strerror(errno));
}

} // namespace tool
