#include "Command.h"

#include <getopt.h>

#include <algorithm>

#include "Masking.h"

namespace {

const size_t NAME_WIDTH = 28;

// What getopt_long() gives for the first option, above all characters.
const int FIRST_OPTION = 256;

const int AN_ARGUMENT = 1; // what it gives for an argument that is no option

tool::Failure usageFailure(const std::string& strSentence)
{
    return tool::Failure(tool::EXIT_STATUS_USAGE, strSentence);
}

// The name of a long option, if the argument is one: "--name" of "--name=value".
std::string longNameOf(const std::string& strArgument)
{
    return strArgument.size() > 2 && 0 == strArgument.compare(0, 2, "--")
               ? strArgument.substr(0, strArgument.find('='))
               : "";
}

} // namespace

namespace tool {

Command::Command(std::string strName, std::string strDescription, Run run)
    : m_strName(std::move(strName)), m_strDescription(std::move(strDescription)), m_run(std::move(run))
{
}

void Command::addOption(const std::string& strNames, Parameter parameter)
{
    const size_t nLong = strNames.find("--");
    parameter.strName = strNames.substr(nLong);
    if (0 != nLong) {
        parameter.cShort = strNames[1];
    }
    m_options.push_back(std::move(parameter));
}

void Command::flag(const std::string& strName, bool& blFlag, const std::string& strDescription)
{
    flag(
        strName, [&blFlag] { blFlag = true; }, strDescription);
}

void Command::flag(const std::string& strName, std::function<void()> set, const std::string& strDescription)
{
    const auto take = [set = std::move(set)](const std::string&) { set(); };
    addOption(strName, {"", "", strDescription, take, true});
}

void Command::option(const std::string& strName, const std::string& strType, Take take,
                     const std::string& strDescription)
{
    addOption(strName, {"", strType, strDescription, std::move(take), false});
}

void Command::repeatedOption(const std::string& strName, const std::string& strType, Take take,
                             const std::string& strDescription)
{
    addOption(strName, {"", strType, strDescription, std::move(take), true});
}

void Command::argument(const std::string& strName, Take take, const std::string& strDescription)
{
    optionalArgument(strName, std::move(take), strDescription);
    require(strName);
}

void Command::optionalArgument(const std::string& strName, Take take, const std::string& strDescription)
{
    m_arguments.push_back({strName, "", strDescription, std::move(take), false});
}

void Command::remainingArguments(const std::string& strName, Take take, const std::string& strDescription)
{
    m_arguments.push_back({strName, "", strDescription, std::move(take), true});
}

Command::Parameter* Command::find(const std::string& strName)
{
    for (auto* pParameters : {&m_options, &m_arguments}) {
        for (Parameter& each : *pParameters) {
            if (each.strName == strName) {
                return &each;
            }
        }
    }
    return nullptr;
}

void Command::require(const std::string& strName)
{
    find(strName)->blRequired = true;
}

void Command::exclude(const std::string& strName, const std::string& strOther)
{
    find(strName)->strExcluded.push_back(strOther);
    find(strOther)->strExcluded.push_back(strName);
}

void Command::addOptionText(Parameter& option, const char* szText)
{
    if (!option.blRepeated && !option.strTexts.empty()) {
        throw usageFailure(option.strName + ": can be given once only");
    }
    option.strTexts.emplace_back(szText);
}

void Command::addArgument(const char* szText)
{
    const auto isOpen = [](const Parameter& each) { return each.blRepeated || each.strTexts.empty(); };
    const auto pNext = std::find_if(m_arguments.begin(), m_arguments.end(), isOpen);
    if (m_arguments.end() == pNext) {
        throw usageFailure("unexpected argument " + quoted(szText));
    }
    pNext->strTexts.emplace_back(szText);
}

// What getopt_long() knows of the options.
std::string Command::shortOptions() const
{
    std::string strShort = "-:"; // arguments are told in their places, and what is wrong by us
    for (const Parameter& each : m_options) {
        if (0 != each.cShort) {
            strShort += each.cShort;
            strShort += each.strType.empty() ? "" : ":";
        }
    }
    return strShort;
}

std::vector<struct option> Command::longOptions() const
{
    std::vector<struct option> rgLong;
    for (const Parameter& each : m_options) {
        rgLong.push_back({each.strName.c_str() + 2, each.strType.empty() ? no_argument : required_argument,
                          nullptr, FIRST_OPTION + static_cast<int>(rgLong.size())});
    }
    rgLong.emplace_back(); // the end
    return rgLong;
}

// The option that getopt_long() means.
Command::Parameter& Command::optionOf(int nFound)
{
    if (FIRST_OPTION <= nFound) {
        return m_options[static_cast<size_t>(nFound - FIRST_OPTION)];
    }
    return *std::find_if(m_options.begin(), m_options.end(),
                         [nFound](const Parameter& each) { return each.cShort == nFound; });
}

void Command::addFound(int nFound)
{
    switch (nFound) {
    case AN_ARGUMENT: return addArgument(optarg);
    case ':': throw usageFailure(optionOf(optopt).strName + ": needs a value");
    case '?':
        throw usageFailure(FIRST_OPTION <= optopt
                               ? optionOf(optopt).strName + ": takes no value"
                               : std::string("unknown option \"-") + static_cast<char>(optopt) + "\"");
    default: return addOptionText(optionOf(nFound), nullptr == optarg ? "" : optarg);
    }
}

void Command::read(int nArguments, char** rgArguments)
{
    const std::string strShort = shortOptions();
    const std::vector<struct option> rgLong = longOptions();
    optind = 0; // unlike 1 it makes getopt_long() forget what it has read before
    int nNext = 1;
    for (; nNext < nArguments; nNext = optind) {
        // Whole names only: what is short for one option today may be short for two tomorrow.
        const std::string strName = longNameOf(rgArguments[nNext]);
        if (!strName.empty() && nullptr == find(strName)) {
            throw usageFailure("unknown option " + quoted(strName));
        }
        const int nFound = getopt_long(nArguments, rgArguments, strShort.c_str(), rgLong.data(), nullptr);
        if (-1 == nFound) { // the one argument that it does not tell: "--"
            ++nNext;
            break;
        }
        addFound(nFound);
    }
    for (; nNext < nArguments; ++nNext) {
        addArgument(rgArguments[nNext]);
    }
}

bool Command::has(const std::string& strName) const
{
    return std::any_of(m_options.begin(), m_options.end(), [&](const Parameter& each) {
        return each.strName == strName && !each.strTexts.empty();
    });
}

void Command::check() const
{
    for (const auto* pParameters : {&m_arguments, &m_options}) {
        for (const Parameter& each : *pParameters) {
            if (each.blRequired && each.strTexts.empty()) {
                throw usageFailure(each.strName + " is required");
            }
            for (const std::string& strOther : each.strExcluded) {
                if (!each.strTexts.empty() && has(strOther)) {
                    throw usageFailure(each.strName + " excludes " + strOther);
                }
            }
        }
    }
}

void Command::take()
{
    check();
    for (auto* pParameters : {&m_options, &m_arguments}) {
        for (Parameter& each : *pParameters) {
            for (const std::string& strText : each.strTexts) {
                tool::argument(each.strName, [&] { each.take(strText); });
            }
        }
    }
}

std::string helpLine(const std::string& strName, const std::string& strDescription)
{
    const size_t nBlanks = NAME_WIDTH - std::min(NAME_WIDTH, strName.size());
    return "  " + strName +
           (0 == nBlanks ? "\n" + std::string(NAME_WIDTH + 2, ' ') : std::string(nBlanks, ' ')) +
           strDescription + "\n";
}

std::string Command::help() const
{
    std::string strUsage = "Usage: vemo-access-token " + m_strName + " [OPTIONS]";
    std::string strArguments;
    for (const Parameter& each : m_arguments) {
        const std::string strShown = each.strName + (each.blRepeated ? "..." : "");
        strUsage += each.blRequired ? " " + strShown : " [" + strShown + "]";
        strArguments += helpLine(each.strName, each.strDescription);
    }
    std::string strOptions;
    for (const Parameter& each : m_options) {
        std::string strNote = each.blRequired ? ", required" : "";
        strNote += !each.strType.empty() && each.blRepeated ? ", repeatable" : "";
        for (const std::string& strOther : each.strExcluded) {
            strNote += ", not with " + strOther;
        }
        const std::string strShort = 0 == each.cShort ? "" : std::string{'-', each.cShort, ','};
        const std::string strType = each.strType.empty() ? "" : " " + each.strType;
        strOptions += helpLine(strShort + each.strName + strType,
                               each.strDescription + (strNote.empty() ? "" : " (" + strNote.substr(2) + ")"));
    }
    return strUsage + "\n" + m_strDescription + "\n" +
           (strArguments.empty() ? "" : "\nArguments:\n" + strArguments) + "\nOptions:\n" + strOptions;
}

} // namespace tool
