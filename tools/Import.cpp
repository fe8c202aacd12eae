// import: creates the tokens of files that export wrote; all of a file or none.

#include <cerrno>
#include <cstring>
#include <ctime>
#include <iostream>
#include <map>
#include <memory>

#include "AccessTokenDefine.h"
#include "AccessTokenUtil.h"
#include "Arguments.h"
#include "Commands.h"
#include "Console.h"
#include "InputFile.h"
#include "Json.h"
#include "Store.h"
#include "Values.h"

namespace {

struct Options {
    std::vector<std::string> strFiles;
};

// A token of a file, and the line that it stands on.
struct Line {
    size_t nNumber;
    Json::Value jToken;
};

[[noreturn]] void failOnReading(const std::string& strFile)
{
    throw tool::Failure(tool::EXIT_STATUS_USAGE, strFile + ": " + strerror(errno));
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
        const bool blWhole = jValue.isInt64() && Json::realValue != jValue.type();
        if (blNumber ? !blWhole : jDefault.type() != jValue.type()) {
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
            throw tool::BadValue(tool::quoted(strName) + " is no field of a token");
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

Json::Value recordOf(const std::string& strText)
{
    if (strText.find('\0') != std::string::npos) {
        throw tool::BadValue("holds a NUL byte");
    }
    Json::Value jToken = tool::parseObject(strText, tool::NESTED_MAX + 1); // objects in a record
    checkRecord(jToken);
    return jToken;
}

std::vector<Line> readLines(std::istream& stream, const std::string& strFile)
{
    std::vector<Line> lines;
    std::map<std::string, size_t> lineOf;
    std::string strText;
    for (size_t nLine = 1; std::getline(stream, strText); ++nLine) {
        if (strText.find_first_not_of(" \t\r") == std::string::npos) {
            continue;
        }
        try {
            const Json::Value jToken = recordOf(strText);
            const auto [pFirst, blNew] = lineOf.emplace(jToken["tid"].asString(), nLine);
            if (!blNew) {
                throw tool::BadValue("has the id of line " + std::to_string(pFirst->second));
            }
            lines.push_back({nLine, jToken});
        } catch (const tool::BadValue& bad) {
            throw badLine(strFile, nLine, bad.what());
        }
    }
    return lines;
}

std::vector<Line> readStream(std::istream& stream, const std::string& strFile)
{
    try {
        stream.exceptions(std::ios_base::badbit); // or it hides that memory ran out, and cuts a line short
        std::vector<Line> lines = readLines(stream, strFile);
        if (!ferror(stdin)) {
            return lines;
        }
    } catch (const std::ios_base::failure&) {
    }
    failOnReading(strFile);
}

std::string nameOf(const std::string& strFile)
{
    return strFile == "-" ? "standard input" : tool::shownPath(strFile);
}

std::vector<Line> readFile(const std::string& strFile)
{
    if (strFile == "-") {
        return readStream(std::cin, nameOf(strFile));
    }
    try {
        tool::InputFile file(strFile);
        return readStream(file, nameOf(strFile));
    } catch (const tool::BadValue& bad) {
        throw tool::Failure(tool::EXIT_STATUS_USAGE, bad.what());
    }
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
                throw badLine(nameOf(strFile), line.nNumber, "has the id of a token that is there already");
            }
            store.create(line.jToken);
            nExpired += line.jToken["deadline"].asInt64() < time(nullptr);
            progress.step();
        }
    }
    store.commit();
    tool::print(tool::countText(lines.size(), "token") + " imported\n");
    if (nExpired) {
        tool::complain(std::to_string(nExpired) +
                       " of them expired: the next call of a program purges those");
    }
}

int importTokens(const Options& options)
{
    for (const std::string& strFile : options.strFiles) {
        importFile(strFile);
    }
    return tool::EXIT_STATUS_DONE;
}

} // namespace

namespace tool {

void addImport(Commands& commands)
{
    auto pOptions = std::make_shared<Options>();
    Command& command =
        commands.add("import", "create the tokens of files that export wrote; all of a file or none",
                     [pOptions] { return importTokens(*pOptions); });
    const auto add = [pOptions](const std::string& strFile) {
        if (strFile.empty()) {
            throw BadValue("must not be empty");
        }
        pOptions->strFiles.push_back(strFile);
    };
    command.remainingArguments("FILE", add, "the files; \"-\" is standard input");
    command.require("FILE");
}

} // namespace tool
