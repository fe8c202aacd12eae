// export and import: all tokens as JSON lines, for backups and for moving to another machine.

#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <fstream>
#include <iostream>
#include <map>
#include <memory>

#include "AccessTokenDefine.h"
#include "AccessTokenUtil.h"
#include "Arguments.h"
#include "Commands.h"
#include "Console.h"
#include "Json.h"
#include "Place.h"
#include "Store.h"

namespace {

struct ExportOptions {
    std::string strFile = "-";
};

struct ImportOptions {
    std::vector<std::string> strFiles;
};

// A token of a file, and the line that it stands on.
struct Line {
    size_t nNumber;
    Json::Value jToken;
};

[[noreturn]] void failOn(const std::string& strFile)
{
    throw tool::Failure(tool::EXIT_STATUS_STORE, strFile + ": " + strerror(errno));
}

[[noreturn]] void failOnReading(const std::string& strFile)
{
    throw tool::Failure(tool::EXIT_STATUS_USAGE, strFile + ": " + strerror(errno));
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
        if (!m_pStream) {
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
void writeLines(const Json::Value& jTokens, Write write)
{
    tool::Progress progress("Exporting", jTokens.size());
    for (const Json::Value& jToken : jTokens) {
        write(tool::compactJson(jToken) + "\n");
        progress.step();
    }
}

int exportTokens(const ExportOptions& options)
{
    const Json::Value jTokens = tool::Store(tool::Store::Access::Read).tokens(Json::Value(Json::objectValue));
    if (options.strFile == "-") {
        writeLines(jTokens, tool::print);
    } else {
        NewFile file(options.strFile);
        writeLines(jTokens, [&file](const std::string& strText) { file.write(strText); });
        file.complete();
    }
    tool::complain(std::to_string(jTokens.size()) + " tokens exported");
    return tool::EXIT_STATUS_DONE;
}

// Throws BadValue unless a record is one that the library would have created.
void checkRecord(const Json::Value& jToken)
{
    const std::vector<std::string> strNames = tool::fieldNames();
    for (const std::string& strName : strNames) {
        if (!jToken.isMember(strName)) {
            throw tool::BadValue("has no \"" + strName + "\"");
        }
        const Json::Value& jDefault = VEMO_ACCESS_TOKEN::tokenType()[strName][1];
        const Json::Value& jValue = jToken[strName];
        const bool blNumber = jDefault.isIntegral();
        if (blNumber ? !jValue.isInt64() : jDefault.type() != jValue.type()) {
            throw tool::BadValue("\"" + strName + "\" is no " +
                                 (blNumber              ? "whole number"
                                  : jDefault.isString() ? "string"
                                                        : "object"));
        }
        if (jValue.isString() && jValue.asString().find('\0') != std::string::npos) {
            throw tool::BadValue("\"" + strName + "\" holds a NUL character");
        }
    }
    for (const std::string& strName : jToken.getMemberNames()) {
        if (!VEMO_ACCESS_TOKEN::tokenType().isMember(strName)) {
            throw tool::BadValue("\"" + strName + "\" is no field of a token");
        }
    }
    if (jToken["tid"].asString().size() < VEMO_ATOKEN_LENGTH_MIN) {
        throw tool::BadValue("\"tid\" is shorter than " + std::to_string(VEMO_ATOKEN_LENGTH_MIN) +
                             " characters");
    }
    if (jToken["function"].asString().empty()) {
        throw tool::BadValue("\"function\" is empty");
    }
    if (jToken["uid"].asInt64() < 0 || jToken["uid"].asInt64() >= Json::Int64{UID_ERR}) {
        throw tool::BadValue("\"uid\" is no user's number");
    }
}

// The sentence about a bad line.
tool::Failure badLine(const std::string& strFile, size_t nLine, const std::string& strReason)
{
    return tool::Failure(tool::EXIT_STATUS_USAGE, strFile + ": line " + std::to_string(nLine) + " " +
                                                      strReason + "; nothing of this file was imported");
}

std::vector<Line> readLines(std::istream& stream, const std::string& strFile)
{
    std::vector<Line> lines;
    std::map<std::string, size_t> lineOf;
    std::string strText;
    for (size_t nLine = 1; std::getline(stream, strText); ++nLine) {
        if (strText.empty()) {
            continue;
        }
        try {
            const Json::Value jToken = tool::parseObject(strText);
            checkRecord(jToken);
            const auto [pFirst, blNew] = lineOf.emplace(jToken["tid"].asString(), nLine);
            if (!blNew) {
                throw tool::BadValue("has the id of line " + std::to_string(pFirst->second));
            }
            lines.push_back({nLine, jToken});
        } catch (const tool::BadValue& bad) {
            throw badLine(strFile, nLine, bad.what());
        }
    }
    if (stream.bad()) {
        failOnReading(strFile);
    }
    return lines;
}

std::vector<Line> readFile(const std::string& strFile)
{
    if (strFile == "-") {
        return readLines(std::cin, "standard input");
    }
    std::ifstream stream(strFile, std::ios::binary);
    if (!stream.is_open()) {
        failOnReading(strFile);
    }
    return readLines(stream, strFile);
}

void importFile(const std::string& strFile)
{
    const std::vector<Line> lines = readFile(strFile);
    tool::Store store(tool::Store::Access::Write, tool::Store::Missing::Make);
    size_t nExpired = 0;
    {
        tool::Progress progress("Importing", lines.size());
        for (const Line& line : lines) {
            if (store.find(line.jToken["tid"].asString())) {
                throw badLine(strFile, line.nNumber, "has the id of a token that is there already");
            }
            store.create(line.jToken);
            nExpired += line.jToken["deadline"].asInt64() < time(nullptr);
            progress.step();
        }
    }
    store.commit();
    tool::print(std::to_string(lines.size()) + (1 == lines.size() ? " token" : " tokens") + " imported\n");
    if (nExpired) {
        tool::complain(std::to_string(nExpired) +
                       " of them expired: the next call of a program purges those");
    }
}

int importTokens(const ImportOptions& options)
{
    for (const std::string& strFile : options.strFiles) {
        importFile(strFile);
    }
    return tool::EXIT_STATUS_DONE;
}

} // namespace

namespace tool {

void addExport(Commands& commands)
{
    auto pOptions = std::make_shared<ExportOptions>();
    Command command = commands.add("export", "write all tokens, whole ids included, as JSON lines",
                                   [pOptions] { return exportTokens(*pOptions); });
    command.optionalArgument("FILE", notEmptyInto(pOptions->strFile),
                             "the file, of mode 0600; without it, standard output");
}

void addImport(Commands& commands)
{
    auto pOptions = std::make_shared<ImportOptions>();
    Command command =
        commands.add("import", "create the tokens of files that export wrote; all of a file or none",
                     [pOptions] { return importTokens(*pOptions); });
    const auto add = [pOptions](const std::string& strFile) { pOptions->strFiles.push_back(strFile); };
    command.remainingArguments("FILE", add, "the files; \"-\" is standard input");
    command.require("FILE");
}

} // namespace tool
