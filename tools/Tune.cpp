// tune: indexes and the write-ahead journal, for large stores.

#include <algorithm>
#include <chrono>
#include <functional>
#include <memory>

#include "Change.h"
#include "Commands.h"
#include "Console.h"
#include "Failure.h"
#include "Layout.h"
#include "Progress.h"
#include "Schema.h"
#include "Table.h"

namespace {

using tool::Schema;
using tool::Store;
typedef tool::Table::Kind Kind;

const char* const INDEXED[] = {"deadline", "bind_sid", "function"};
const int MEASUREMENTS = 5;

struct Options {
    bool blDeadlineOnly = false;
    bool blWal = false;
    bool blUndo = false;
    bool blDryRun = false;
    bool blNoHeader = false;
};

// The milliseconds that work takes, as text: the shortest of several times, since others can only prolong it.
std::string timeOf(const std::function<void()>& work)
{
    typedef std::chrono::duration<double, std::milli> Milliseconds;
    Milliseconds shortest = Milliseconds::max();
    for (int i = 0; i < MEASUREMENTS; ++i) {
        const auto start = std::chrono::steady_clock::now();
        work();
        shortest = std::min(shortest, Milliseconds(std::chrono::steady_clock::now() - start));
    }
    char szText[32];
    snprintf(szText, sizeof(szText), "%.2f ms", shortest.count());
    return szText;
}

std::string nameOfIndex(const std::string& strField)
{
    return "token_" + strField;
}

typedef std::vector<std::pair<std::string, std::string>> Figures;

// What the store has, and how fast it is, in the same words before and after.
Figures measured(Schema& schema, bool blWrite)
{
    const auto timeOfSearch = [&schema](const char* szWhere) {
        return timeOf([&] { schema.eachTid(szWhere, [](const auto&) {}); });
    };
    Figures lines = {{"look for expired tokens, as every call does", timeOfSearch(grant::SQL_EXPIRED)},
                     {"look for a session's tokens", timeOfSearch("bind_sid = '\x01'")},
                     {"look for a purpose's tokens", timeOfSearch("function = '\x01'")},
                     {"journal", schema.journal()}};
    for (const std::string strField : INDEXED) {
        const std::string strName = nameOfIndex(strField);
        lines.emplace_back("index " + strName, schema.hasIndex(strName) ? "yes" : "no");
    }
    if (blWrite) {
        lines.emplace_back("write a small change", timeOf([&schema] { schema.writeSame(); }));
    }
    return lines;
}

std::string indexStatement(const std::string& strField, const Options& options)
{
    const std::string strName = nameOfIndex(strField);
    const bool blWanted = !options.blUndo && (!options.blDeadlineOnly || strField == "deadline");
    return blWanted ? "CREATE INDEX IF NOT EXISTS " + strName + " ON token (" + strField + ")"
                    : "DROP INDEX IF EXISTS " + strName;
}

// The journal comes first: connections of others can prevent its change, and then nothing has changed.
std::vector<std::string> statements(const Options& options)
{
    std::vector<std::string> strStatements;
    if (options.blUndo || options.blWal) {
        strStatements.push_back(std::string("PRAGMA journal_mode = ") + (options.blUndo ? "delete" : "wal"));
    }
    strStatements.push_back("BEGIN IMMEDIATE");
    for (const std::string strField : INDEXED) {
        strStatements.push_back(indexStatement(strField, options));
    }
    strStatements.push_back("COMMIT");
    return strStatements;
}

void execute(Schema& schema, const Options& options, tool::Progress& progress)
{
    const std::string strJournal = options.blUndo ? "delete" : "wal";
    if (options.blUndo || options.blWal) {
        schema.holdSignals(); // the statement for the journal commits by itself
    }
    for (const std::string& strStatement : statements(options)) {
        if (strStatement == "COMMIT") {
            schema.commitChange();
        } else {
            const std::string strResult = schema.run(strStatement);
            // Only the statement for the journal returns a row. It can have no effect without reporting an
            // error.
            if (!strResult.empty() && strResult != strJournal) {
                throw tool::Failure(tool::EXIT_STATUS_STORE,
                                    "the journal cannot be made \"" + strJournal + "\" here");
            }
            if (!strResult.empty()) {
                tool::settleChange();
            }
        }
        progress.step();
    }
}

Figures look()
{
    Schema schema(Store::Access::Read);
    return measured(schema, false);
}

// Prints the state of the store, and the statements that would be run.
int tell(const Options& options)
{
    tool::Table table({{"WHAT", Kind::Short}, {"NOW", Kind::Short}}, !options.blNoHeader);
    for (const auto& [strWhat, strNow] : look()) {
        table.add({strWhat, strNow});
    }
    table.print();
    for (const std::string& strStatement : statements(options)) {
        tool::print("would run: " + strStatement + "\n");
    }
    return tool::EXIT_STATUS_DONE;
}

// Tunes the store. Returns the figures before and after.
std::pair<Figures, Figures> change(const Options& options)
{
    tool::Progress progress("Tuning", [&options] { return statements(options).size(); });
    Schema schema(Store::Access::Locked);
    const Figures before = measured(schema, true);
    try {
        execute(schema, options, progress);
        return {before, measured(schema, true)};
    } catch (const tool::Failure& failure) {
        if (!tool::hasChanged() || failure.what() != failure.fact()) {
            throw; // nothing has changed, or the sentence says what has
        }
        throw tool::Failure(
            failure.status(), failure.fact(),
            "the store has changed: \"vemo-access-token tune --dry-run\" shows it as it is now");
    }
}

int tune(const Options& options)
{
    if (options.blDryRun) {
        return tell(options);
    }
    const auto [before, after] = change(options);
    tool::Table table({{"WHAT", Kind::Short}, {"BEFORE", Kind::Short}, {"AFTER", Kind::Short}},
                      !options.blNoHeader);
    for (size_t i = 0; i < before.size(); ++i) {
        table.add({before[i].first, before[i].second, after[i].second});
    }
    table.print();
    return tool::EXIT_STATUS_DONE;
}

} // namespace

namespace tool {

void addTune(Commands& commands)
{
    auto pOptions = std::make_shared<Options>();
    Command& command = commands.add("tune", "add indexes for a large store, and print what that changes",
                                    [pOptions] { return tune(*pOptions); });
    command.flag("--deadline-only", pOptions->blDeadlineOnly,
                 "only the index on the deadline, for programs that never delete by session or purpose");
    command.flag("--wal", pOptions->blWal,
                 "the write-ahead journal too, for programs that hold their connection");
    command.flag("--undo", pOptions->blUndo, "remove the indexes and the write-ahead journal");
    command.exclude("--undo", "--wal");
    command.exclude("--undo", "--deadline-only");
    command.flag("--dry-run", pOptions->blDryRun, "only measure, and print what would be run");
    command.flag("--no-header", pOptions->blNoHeader, "no line of titles above the table");
    command.example("--dry-run");
    command.example("--wal");
}

} // namespace tool
