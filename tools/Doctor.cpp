// doctor: says what is wrong, what that means and what helps.

#include <algorithm>
#include <memory>

#include "Commands.h"
#include "Console.h"
#include "Examination.h"
#include "Failure.h"
#include "Json.h"
#include "Layout.h"

namespace {

using tool::Finding;

struct Options {
    bool blRepair = false;
    tool::Layout layout;
};

const char* severityText(const Finding& finding)
{
    switch (finding.severity) {
    case Finding::Severity::Error: return "error";
    case Finding::Severity::Warning: return "warning";
    case Finding::Severity::Note: break;
    }
    return "note";
}

const char* colourOf(const Finding& finding)
{
    switch (finding.severity) {
    case Finding::Severity::Error: return "\x1b[31m";
    case Finding::Severity::Warning: return "\x1b[33m";
    case Finding::Severity::Note: break;
    }
    return "\x1b[36m";
}

Json::Value jsonOf(const Finding& finding, bool blRepaired)
{
    Json::Value jFinding;
    jFinding["severity"] = severityText(finding);
    jFinding["finding"] = finding.strWhat;
    jFinding["meaning"] = finding.strMeaning;
    jFinding["remedy"] = finding.strRemedy;
    jFinding["repaired"] = blRepaired;
    return jFinding;
}

void printText(const Finding& finding, bool blRepaired)
{
    const char* szColour = blRepaired ? "\x1b[32m" : colourOf(finding);
    const bool blColoured = tool::isColoured(tool::resultStream());
    const std::string strMark = blRepaired ? "repaired" : severityText(finding);
    tool::print((blColoured ? szColour + strMark + "\x1b[0m" : strMark) + ": " +
                tool::printable(finding.strWhat) + "\n    meaning: " + tool::printable(finding.strMeaning) +
                "\n");
    if (!blRepaired) {
        tool::print("    remedy: " + tool::printable(finding.strRemedy) + "\n");
    }
}

void report(const tool::Findings& repaired, const tool::Findings& left, const tool::Layout& layout)
{
    Json::Value jFindings(Json::arrayValue);
    const auto add = [&](const Finding& finding, bool blRepaired) {
        if (tool::Layout::Form::Table == layout.form) {
            printText(finding, blRepaired);
        } else if (tool::Layout::Form::JsonLines == layout.form) {
            tool::print(tool::compactJson(jsonOf(finding, blRepaired)) + "\n");
        }
        jFindings.append(jsonOf(finding, blRepaired));
    };
    for (const Finding& finding : repaired) {
        add(finding, true);
    }
    for (const Finding& finding : left) {
        add(finding, false);
    }
    if (tool::Layout::Form::Json == layout.form) {
        tool::print(tool::styledJson(jFindings) + "\n");
    } else if (tool::Layout::Form::Table == layout.form && tool::areNotes(left)) {
        tool::print("no findings\n");
    }
}

bool contains(const tool::Findings& findings, const Finding& wanted)
{
    return std::any_of(findings.begin(), findings.end(),
                       [&wanted](const Finding& each) { return each.strWhat == wanted.strWhat; });
}

// Returns whether the repair was carried out.
bool repair(const Finding& finding)
{
    try {
        finding.repair();
        return true;
    } catch (const tool::Failure& failure) {
        tool::complain(std::string("cannot repair: ") + failure.what());
        return false;
    }
}

// Repairs what can be repaired, and examines again. Returns whether that helped: something was repaired, no
// repair failed, and nothing that was repaired is found again.
bool repairOnce(tool::Findings& repaired, tool::Findings& left)
{
    tool::Findings tried;
    bool blHelped = true;
    for (const Finding& finding : left) {
        if (finding.repair && repair(finding)) {
            tried.push_back(finding);
        } else if (finding.repair) {
            blHelped = false;
        }
    }
    left = tool::examine();
    for (const Finding& finding : tried) {
        if (contains(left, finding)) {
            tool::complain("the repair did not help: " + finding.strWhat);
            blHelped = false;
        } else {
            repaired.push_back(finding);
        }
    }
    return blHelped && !tried.empty();
}

int doctor(const Options& options)
{
    tool::Findings repaired;
    tool::Findings left = tool::examine();
    while (options.blRepair && repairOnce(repaired, left)) {
        // After a repair, more can be examined, and may need repair too.
    }
    report(repaired, left, options.layout);
    return tool::areNotes(left) ? tool::EXIT_STATUS_DONE : tool::EXIT_STATUS_FINDINGS;
}

} // namespace

namespace tool {

void addDoctor(Commands& commands)
{
    auto pOptions = std::make_shared<Options>();
    Command& command = commands.add(
        "doctor", "say what is wrong with the store, what it means and what helps",
        [pOptions] { return doctor(*pOptions); }, Commands::Needs::Nothing);
    command.flag("--repair", pOptions->blRepair,
                 "repair what can be; deletes tokens that cannot be read, and the expired");
    addForm(command, pOptions->layout);
    command.example("");
    command.example("--repair");
}

} // namespace tool
