// import: creates the tokens of files that export wrote; all of a file or none.

#include <cerrno>
#include <cstring>
#include <ctime>
#include <iostream>
#include <map>
#include <memory>

#include "AccessTokenUtil.h"
#include "Arguments.h"
#include "Commands.h"
#include "Console.h"
#include "ExportEnd.h"
#include "InputFile.h"
#include "Json.h"
#include "Progress.h"
#include "Store.h"
#include "Values.h"

namespace {

struct Options {
    bool blPartial = false;
    std::vector<std::string> strFiles;
};

// A token of a file, and the line that it stands on.
struct Line {
    size_t nNumber;
    Json::Value jToken;
};

// The tokens of a file, and why it is no whole export; "" when it is one.
struct Contents {
    std::vector<Line> lines;
    std::string strFlaw = "the export has no end";
};

[[noreturn]] void failOnReading(const std::string& strFile)
{
    throw tool::Failure(tool::EXIT_STATUS_USAGE, strFile + ": " + strerror(errno));
}

// Throws BadValue unless a record is one that the store can hold: what programs save there is not always what
// they could create.
void checkRecord(const Json::Value& jToken)
{
    for (const std::string& strName : tool::fieldNames()) {
        if (!jToken.isMember(strName)) {
            throw tool::BadValue("has no \"" + strName + "\"");
        }
        const Json::Value& jDefault = VEMO_ACCESS_TOKEN::tokenType()[strName][1];
        const Json::Value& jValue = jToken[strName];
        const bool blWhole = jValue.isInt64() && Json::realValue != jValue.type();
        if (jDefault.isIntegral() && !blWhole) {
            throw tool::BadValue("\"" + strName + "\" is no whole number");
        }
        if (jDefault.isString() && !jValue.isString()) {
            throw tool::BadValue("\"" + strName + "\" is no string");
        }
        if (jDefault.isString() && jValue.asString().find('\0') != std::string::npos) {
            throw tool::BadValue("\"" + strName + "\" holds a NUL character");
        }
    }
    for (const std::string& strName : jToken.getMemberNames()) {
        if (!VEMO_ACCESS_TOKEN::tokenType().isMember(strName)) {
            throw tool::BadValue(tool::quoted(strName) + " is no field of a token");
        }
    }
}

// The sentence about a file that is not imported.
tool::Failure badFile(const std::string& strFile, const std::string& strReason, const std::string& strHint)
{
    return tool::Failure(tool::EXIT_STATUS_USAGE,
                         strFile + ": " + strReason + "; nothing of this file was imported", strHint);
}

std::string lineText(size_t nLine, const std::string& strText)
{
    return "line " + std::to_string(nLine) + " " + strText;
}

tool::Failure badLine(const std::string& strFile, size_t nLine, const std::string& strReason)
{
    return badFile(strFile, lineText(nLine, strReason), "");
}

Json::Value objectOf(const std::string& strText)
{
    return tool::parseObject(strText, tool::NESTED_MAX + 1); // objects in a record
}

// Whether a last line, without a line feed, is the beginning of one.
bool isCutOff(const std::string& strText)
{
    try {
        objectOf(strText);
        return false;
    } catch (const tool::BadValue&) {
        return strText[0] == '{';
    }
}

Contents readLines(std::istream& stream, const std::string& strFile)
{
    Contents contents;
    std::map<std::string, size_t> lineOf;
    tool::ExportEnd end;
    bool blEnded = false;
    std::string strText;
    for (size_t nLine = 1; std::getline(stream, strText); ++nLine) {
        try {
            if (blEnded) {
                throw tool::BadValue("stands behind the end of the export");
            }
            if (strText.find('\0') != std::string::npos) {
                throw tool::BadValue("holds a NUL byte");
            }
            if (stream.eof() && isCutOff(strText)) {
                contents.strFlaw += ", and " + lineText(nLine, "is cut off");
                break;
            }
            if (strText.find_first_not_of(" \t\r") != std::string::npos) {
                const Json::Value jLine = objectOf(strText);
                if (tool::ExportEnd::is(jLine)) {
                    const std::string strFlaw = end.flawOf(jLine, contents.lines.size());
                    contents.strFlaw = strFlaw.empty() ? "" : lineText(nLine, strFlaw);
                    blEnded = true;
                    continue;
                }
                checkRecord(jLine);
                const auto [pFirst, blNew] = lineOf.emplace(jLine["tid"].asString(), nLine);
                if (!blNew) {
                    throw tool::BadValue("has the id of line " + std::to_string(pFirst->second));
                }
                contents.lines.push_back({nLine, jLine});
            }
            end.add(strText + "\n");
        } catch (const tool::BadValue& bad) {
            throw badLine(strFile, nLine, bad.what());
        }
    }
    return contents;
}

Contents readStream(std::istream& stream, const std::string& strFile)
{
    try {
        stream.exceptions(std::ios_base::badbit); // or it hides that memory ran out, and cuts a line short
        Contents contents = readLines(stream, strFile);
        if (!ferror(stdin)) {
            return contents;
        }
    } catch (const std::ios_base::failure&) {
    }
    failOnReading(strFile);
}

std::string nameOf(const std::string& strFile)
{
    return strFile == "-" ? "standard input" : tool::shownPath(strFile);
}

Contents readFile(const std::string& strFile)
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

// Returns how many of them have expired.
size_t createTokens(const std::vector<Line>& lines, const std::string& strFile)
{
    tool::Progress progress("Importing", lines.size());
    tool::Store store(tool::Store::Access::Write, tool::Store::Missing::Make);
    size_t nExpired = 0;
    for (const Line& line : lines) {
        Json::Value jFilter;
        jFilter["tid"] = line.jToken["tid"];
        if (!store.tokens(jFilter).empty()) {
            throw badLine(nameOf(strFile), line.nNumber, "has the id of a token that is there already");
        }
        store.create(line.jToken);
        nExpired += line.jToken["deadline"].asInt64() < time(nullptr);
        progress.step();
    }
    store.commit();
    return nExpired;
}

void importFile(const std::string& strFile, bool blPartial)
{
    const Contents contents = readFile(strFile);
    const std::vector<Line>& lines = contents.lines;
    if (!contents.strFlaw.empty() && !blPartial) {
        throw badFile(nameOf(strFile), contents.strFlaw, "--partial imports what is there");
    }
    const size_t nExpired = createTokens(lines, strFile);
    tool::print(tool::countText(lines.size(), "token") + " imported\n");
    if (!contents.strFlaw.empty()) {
        tool::complain(nameOf(strFile) + ": " + contents.strFlaw + "; the whole lines were imported");
    }
    if (nExpired) {
        tool::complain(std::to_string(nExpired) +
                       " of them expired: the next call of a program purges those");
    }
}

int importTokens(const Options& options)
{
    for (const std::string& strFile : options.strFiles) {
        importFile(strFile, options.blPartial);
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
    command.flag("--partial", pOptions->blPartial,
                 "import what is there of an export that is not whole or was changed");
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
