// import: creates the tokens of files that export wrote; all of a file or none, or in steps.

#include <cerrno>
#include <chrono>
#include <cstring>
#include <ctime>
#include <functional>
#include <iostream>
#include <map>
#include <memory>
#include <optional>
#include <thread>

#include "AccessTokenUtil.h"
#include "Arguments.h"
#include "Commands.h"
#include "Console.h"
#include "ExportEnd.h"
#include "InputFile.h"
#include "Json.h"
#include "Masking.h"
#include "Progress.h"
#include "Steps.h"
#include "Store.h"
#include "Values.h"

namespace {

// The most tokens of a transaction: it stops other programs for about half a second at most.
const size_t TOKENS_AT_ONCE = 10000;
const size_t TOKENS_OF_A_STEP = 4000;

struct Options {
    bool blPartial = false;
    bool blSkipExisting = false;
    bool blInSteps = false;
    std::vector<std::string> strFiles;
};

// A token of a file, and the number of its line.
struct NumberedToken {
    size_t nNumber;
    Json::Value jToken;
};

// What was read of a file: the number of its tokens, and why it is not a complete export, or "".
struct Contents {
    uint64_t nTokens = 0;
    std::string strFlaw = "the export has no end";
};

typedef std::function<void(NumberedToken line)> Take;

[[noreturn]] void failOnReading(const std::string& strFile)
{
    throw tool::Failure(tool::EXIT_STATUS_USAGE, strFile + ": " + strerror(errno));
}

// Throws BadValue unless the store can hold the record. Does not ask whether it could be created: programs
// also save tokens that they could not create.
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
            throw tool::BadValue("\"" + strName + "\" is not a whole number");
        }
        if (jDefault.isString() && !jValue.isString()) {
            throw tool::BadValue("\"" + strName + "\" is not a string");
        }
        if (jDefault.isString() && jValue.asString().find('\0') != std::string::npos) {
            throw tool::BadValue("\"" + strName + "\" holds a NUL character");
        }
    }
    for (const std::string& strName : jToken.getMemberNames()) {
        if (!VEMO_ACCESS_TOKEN::tokenType().isMember(strName)) {
            throw tool::BadValue(tool::quoted(strName) + " is not a field of a token");
        }
    }
}

// The failure for a file that is not imported.
tool::Failure badFile(const std::string& strFile, const std::string& strReason, const std::string& strHint)
{
    return tool::Failure(tool::EXIT_STATUS_USAGE,
                         strFile + ": " + strReason + "; nothing of this file was imported", strHint);
}

std::string lineText(size_t nLine, const std::string& strText)
{
    return "line " + std::to_string(nLine) + " " + strText;
}

Json::Value objectOf(const std::string& strText)
{
    return tool::parseObject(strText, tool::NESTED_MAX + 1); // a record adds a level
}

// Whether the last line, which has no line feed, is only the beginning of a record.
bool isCutOff(const std::string& strText)
{
    try {
        objectOf(strText);
        return false;
    } catch (const tool::BadValue&) {
        return strText[0] == '{';
    }
}

// Throws BadValue for a bad line.
Contents readLines(std::istream& stream, const Take& take)
{
    Contents contents;
    tool::ExportEnd end;
    bool blEnded = false;
    std::string strText;
    for (size_t nLine = 1; std::getline(stream, strText); ++nLine) {
        try {
            if (blEnded) {
                throw tool::BadValue("comes after the end of the export");
            }
            if (strText.find('\0') != std::string::npos) {
                throw tool::BadValue("holds a NUL byte");
            }
            if (stream.eof() && isCutOff(strText)) {
                contents.strFlaw += ", and " + lineText(nLine, "is cut off");
                break;
            }
            if (strText.find_first_not_of(" \t\r") != std::string::npos) {
                Json::Value jLine = objectOf(strText);
                if (tool::ExportEnd::is(jLine)) {
                    const std::string strFlaw = end.flawOf(jLine, contents.nTokens);
                    contents.strFlaw = strFlaw.empty() ? "" : lineText(nLine, strFlaw);
                    blEnded = true;
                    continue;
                }
                checkRecord(jLine);
                take({nLine, std::move(jLine)});
                ++contents.nTokens;
            }
            end.add(strText + "\n");
        } catch (const tool::BadValue& bad) {
            throw tool::BadValue(lineText(nLine, bad.what()));
        }
    }
    return contents;
}

Contents readStream(std::istream& stream, const std::string& strFile, const Take& take)
{
    try {
        stream.exceptions(std::ios_base::badbit); // else lack of memory would go unnoticed and shorten a line
        const Contents contents = readLines(stream, take);
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

Contents readFile(const std::string& strFile, const Take& take)
{
    if (strFile == "-") {
        return readStream(std::cin, nameOf(strFile), take);
    }
    std::optional<tool::InputFile> file;
    try {
        file.emplace(strFile);
    } catch (const tool::BadValue& bad) {
        throw tool::Failure(tool::EXIT_STATUS_USAGE, bad.what());
    }
    return readStream(*file, nameOf(strFile), take);
}

// Reads a file before anything of it is imported. Throws a Failure that says so.
Contents readAhead(const std::string& strFile, const Options& options, const Take& take)
{
    try {
        const Contents contents = readFile(strFile, take);
        if (!contents.strFlaw.empty() && !options.blPartial) {
            throw badFile(nameOf(strFile), contents.strFlaw, "--partial imports what is there");
        }
        return contents;
    } catch (const tool::BadValue& bad) {
        throw badFile(nameOf(strFile), bad.what(), "");
    }
}

// What became of the tokens of a file.
struct Imported {
    uint64_t nCreated = 0;
    uint64_t nSkipped = 0;
    uint64_t nExpired = 0; // of nCreated
};

// Creates tokens in one transaction. An existing token is skipped if blSkip, and a failure otherwise.
void createTokens(const std::vector<NumberedToken>& lines, const std::string& strFile, bool blSkip,
                  tool::Progress& progress, Imported& imported)
{
    Imported now;
    tool::Store store(tool::Store::Access::Write, tool::Store::Missing::Make);
    for (const NumberedToken& line : lines) {
        if (!store.has(line.jToken["tid"].asString())) {
            store.create(line.jToken);
            ++now.nCreated;
            now.nExpired += line.jToken["deadline"].asInt64() < time(nullptr);
        } else if (blSkip) {
            ++now.nSkipped;
        } else {
            throw badFile(nameOf(strFile),
                          lineText(line.nNumber, "has the id of a token that is there already"), "");
        }
        progress.step();
    }
    store.commit();
    imported.nCreated += now.nCreated;
    imported.nSkipped += now.nSkipped;
    imported.nExpired += now.nExpired;
}

Contents importAtOnce(const std::string& strFile, const Options& options, Imported& imported)
{
    std::vector<NumberedToken> lines;
    std::map<std::string, size_t> lineOf;
    const Contents contents = readAhead(strFile, options, [&](NumberedToken line) {
        const auto [pFirst, blNew] = lineOf.emplace(line.jToken["tid"].asString(), line.nNumber);
        if (!blNew) {
            throw tool::BadValue("has the id of line " + std::to_string(pFirst->second));
        }
        if (lines.size() == TOKENS_AT_ONCE) {
            throw badFile(nameOf(strFile),
                          "more than " + std::to_string(TOKENS_AT_ONCE) +
                              " tokens would hold all programs up",
                          "--in-steps lets them through");
        }
        lines.push_back(std::move(line));
    });
    tool::Progress progress("Importing", [&lines] { return lines.size(); });
    createTokens(lines, strFile, options.blSkipExisting, progress, imported);
    return contents;
}

// A file is first read without importing anything, to check that it is complete. A stream cannot be read
// twice: if it turns out incomplete, a part has been imported.
Contents importInSteps(const std::string& strFile, const Options& options, Imported& imported)
{
    uint64_t nTokens = 0;
    if (strFile != "-") {
        nTokens = readAhead(strFile, options, [](const NumberedToken&) {}).nTokens;
    }
    tool::Progress progress(
        "Importing", [nTokens] { return nTokens; }, strFile != "-");
    std::vector<NumberedToken> lines;
    const auto create = [&] {
        createTokens(lines, strFile, true, progress, imported);
        lines.clear();
        std::this_thread::sleep_for(tool::BETWEEN_STEPS);
    };
    const auto stopped = [&imported](tool::ExitStatus status, const std::string& strFact) {
        return tool::Failure(status, strFact,
                             tool::countText(imported.nCreated, "token") +
                                 " imported before that; the command can be repeated without harm");
    };
    try {
        const Contents contents = readFile(strFile, [&](NumberedToken line) {
            lines.push_back(std::move(line));
            if (lines.size() == TOKENS_OF_A_STEP) {
                create();
            }
        });
        create();
        if (!contents.strFlaw.empty() && !options.blPartial) {
            throw tool::BadValue(contents.strFlaw);
        }
        return contents;
    } catch (const tool::BadValue& bad) {
        throw stopped(tool::EXIT_STATUS_USAGE, nameOf(strFile) + ": " + bad.what());
    } catch (const tool::Failure& failure) {
        throw stopped(failure.status(), failure.what()); // its message says what became of its own step
    }
}

void importFile(const std::string& strFile, const Options& options)
{
    Imported imported;
    const Contents contents = options.blInSteps ? importInSteps(strFile, options, imported)
                                                : importAtOnce(strFile, options, imported);
    tool::print(
        tool::countText(imported.nCreated, "token") + " imported" +
        (imported.nSkipped ? "; " + tool::countText(imported.nSkipped, "token") + " there already" : "") +
        "\n");
    if (!contents.strFlaw.empty()) {
        tool::complain(nameOf(strFile) + ": " + contents.strFlaw + "; the whole lines were imported");
    }
    if (imported.nExpired) {
        tool::complain(std::to_string(imported.nExpired) +
                       " of them expired: the next call of a program purges those");
    }
}

int importTokens(const Options& options)
{
    for (const std::string& strFile : options.strFiles) {
        importFile(strFile, options);
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
                 "import the whole lines of an export that is cut off or was changed");
    command.flag("--skip-existing", pOptions->blSkipExisting,
                 "keep the tokens whose ids exist already, and import the others");
    command.flag("--in-steps", pOptions->blInSteps,
                 "let programs through in between; keeps tokens that exist already, so it can be repeated");
    const auto add = [pOptions](const std::string& strFile) {
        if (strFile.empty()) {
            throw BadValue("must not be empty");
        }
        pOptions->strFiles.push_back(strFile);
    };
    command.remainingArguments("FILE", add, "the files; \"-\" is standard input");
    command.require("FILE");
    command.example("tokens.jsonl");
    command.example("--partial tokens.jsonl");
}

} // namespace tool
