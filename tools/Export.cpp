// export: writes all tokens as JSON lines, for backups and for moving to another machine.

#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "Arguments.h"
#include "Commands.h"
#include "Console.h"
#include "Json.h"
#include "Place.h"
#include "Store.h"
#include "Values.h"

namespace {

struct Options {
    std::string strFile = "-";
};

[[noreturn]] void failOn(const std::string& strFile)
{
    throw tool::Failure(tool::EXIT_STATUS_STORE, strFile + ": " + strerror(errno));
}

// A file that appears under its name only when it is complete, and until then removes itself. It is
// readable by its owner only.
class NewFile {
public:
    explicit NewFile(const std::string& strName) : m_strName(strName), m_strTemporary(strName + ".XXXXXX")
    {
        const auto status = tool::statusOf(strName);
        if (status && !S_ISREG(status->st_mode)) {
            throw tool::Failure(tool::EXIT_STATUS_USAGE,
                                strName +
                                    " is no regular file; to write to a pipe, write to standard output");
        }
        const int nFile = mkstemp(m_strTemporary.data());
        m_pStream = 0 > nFile ? nullptr : fdopen(nFile, "w");
        // The umask may have taken bits away.
        if (!m_pStream || 0 != fchmod(nFile, S_IRUSR | S_IWUSR)) {
            failOn(strName);
        }
    }
    ~NewFile()
    {
        if (m_pStream) {
            fclose(m_pStream);
            unlink(m_strTemporary.c_str());
        }
    }
    NewFile(const NewFile&) = delete;
    NewFile& operator=(const NewFile&) = delete;

    void write(const std::string& strText) { fwrite(strText.data(), 1, strText.size(), m_pStream); }
    void complete()
    {
        if (0 != fflush(m_pStream) || ferror(m_pStream) || 0 != fsync(fileno(m_pStream)) ||
            0 != rename(m_strTemporary.c_str(), m_strName.c_str())) {
            failOn(m_strName);
        }
        fclose(m_pStream);
        m_pStream = nullptr;
    }

private:
    const std::string m_strName;
    std::string m_strTemporary;
    FILE* m_pStream;
};

template <typename Write>
void writeLines(const Json::Value& jTokens, bool blProgress, Write write)
{
    tool::Progress progress("Exporting", jTokens.size(), blProgress);
    for (const Json::Value& jToken : jTokens) {
        write(tool::compactJson(jToken) + "\n");
        progress.step();
    }
}

int exportTokens(const Options& options)
{
    const Json::Value jTokens = tool::Store(tool::Store::Access::Read).tokens(Json::Value(Json::objectValue));
    if (options.strFile == "-") {
        // On one terminal the two would get mixed.
        writeLines(jTokens, !tool::isTerminal(tool::resultStream()), tool::print);
        tool::flushResult();
    } else {
        NewFile file(options.strFile);
        writeLines(jTokens, true, [&file](const std::string& strText) { file.write(strText); });
        file.complete();
    }
    tool::complain(tool::countText(jTokens.size(), "token") + " exported");
    return tool::EXIT_STATUS_DONE;
}

} // namespace

namespace tool {

void addExport(Commands& commands)
{
    auto pOptions = std::make_shared<Options>();
    Command command = commands.add("export", "write all tokens, whole ids included, as JSON lines",
                                   [pOptions] { return exportTokens(*pOptions); });
    command.optionalArgument("FILE", notEmptyInto(pOptions->strFile),
                             "the file, of mode 0600; without it, standard output");
}

} // namespace tool
