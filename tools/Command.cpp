#include "Command.h"

#include <getopt.h>

#include <algorithm>
#include <sstream>

#include "Masking.h"
#include "Nearest.h"

namespace {

const size_t NAME_WIDTH = 28;
const size_t HELP_WIDTH = 80;

// The value of getopt_long() for the first long option; it is above all characters.
const int FIRST_OPTION = 256;

const int AN_ARGUMENT = 1; // its value for an argument that is not an option

tool::Failure usageFailure(const std::string& strSentence, const std::string& strHint = "")
{
    return tool::Failure(tool::EXIT_STATUS_USAGE, strSentence, strHint);
}

// The name of a long option, if the argument is one: "--name" of "--name=value".
std::string longNameOf(const std::string& strArgument)
{
    return strArgument.size() > 2 && 0 == strArgument.compare(0, 2, "--")
               ? strArgument.substr(0, strArgument.find('='))
               : "";
}

// Appends words to a line. What does not fit continues on new lines, each after the margin.
std::string wrapped(std::string strLine, const std::string& strMargin, const std::string& strWords)
{
    std::string strText;
    std::istringstream words(strWords);
    for (std::string strWord; words >> strWord;) {
        if (strLine.size() + 1 + strWord.size() > HELP_WIDTH) {
            strText += strLine + "\n";
            strLine = strMargin;
        }
        strLine += (strLine.size() == strMargin.size() ? "" : " ") + strWord;
    }
    return strText + strLine + "\n";
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

void Command::example(const std::string& strArguments)
{
    m_strExamples.push_back(strArguments);
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

void Command::addWord(Parameter& parameter, const char* szText)
{
    parameter.blGiven = true;
    m_words.push_back({&parameter, szText});
}

void Command::addOptionText(Parameter& option, const char* szText)
{
    if (!option.blRepeated && option.blGiven) {
        throw usageFailure(option.strName + ": can be given once only");
    }
    addWord(option, szText);
}

void Command::addArgument(const char* szText)
{
    const auto isOpen = [](const Parameter& each) { return each.blRepeated || !each.blGiven; };
    const auto pNext = std::find_if(m_arguments.begin(), m_arguments.end(), isOpen);
    if (m_arguments.end() == pNext) {
        throw usageFailure("unexpected argument " + quoted(szText));
    }
    addWord(*pNext, szText);
}

// The options as getopt_long() takes them.
std::string Command::shortOptions() const
{
    std::string strShort = "-:"; // "-": arguments come in their places; ":": getopt_long() prints no messages
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

// The option that a value of getopt_long() stands for.
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

// Refuses abbreviated names: what stands for one option today may stand for two in a later version.
void Command::requireLongName(const std::string& strName)
{
    if (strName.empty() || find(strName)) {
        return;
    }
    std::vector<std::string> strNames;
    for (const Parameter& each : m_options) {
        strNames.push_back(each.strName);
    }
    throw usageFailure("unknown option " + quoted(strName), didYouMean(strName, strNames));
}

void Command::readWords(int nArguments, char** rgArguments)
{
    const std::string strShort = shortOptions();
    const std::vector<struct option> rgLong = longOptions();
    int nNext = 1;
    for (; nNext < nArguments; nNext = optind) {
        requireLongName(longNameOf(rgArguments[nNext]));
        const int nFound = getopt_long(nArguments, rgArguments, strShort.c_str(), rgLong.data(), nullptr);
        if (-1 == nFound) { // at "--", the only argument that it does not return
            ++nNext;
            break;
        }
        addFound(nFound);
    }
    for (; nNext < nArguments; ++nNext) {
        addArgument(rgArguments[nNext]);
    }
}

void Command::read(int nArguments, char** rgArguments)
{
    try {
        readWords(nArguments, rgArguments);
    } catch (const Failure&) {
        takeWords(); // of several faults, report the first
        throw;
    }
}

bool Command::has(const std::string& strName) const
{
    return std::any_of(m_options.begin(), m_options.end(),
                       [&](const Parameter& each) { return each.strName == strName && each.blGiven; });
}

void Command::check() const
{
    for (const auto* pParameters : {&m_arguments, &m_options}) {
        for (const Parameter& each : *pParameters) {
            if (each.blRequired && !each.blGiven) {
                throw usageFailure(each.strName + " is required");
            }
        }
    }
    for (const Word& word : m_words) {
        for (const std::string& strOther : word.pParameter->strExcluded) {
            if (has(strOther)) {
                throw usageFailure(word.pParameter->strName + " excludes " + strOther);
            }
        }
    }
}

void Command::takeWords() const
{
    for (const Word& word : m_words) {
        try {
            word.pParameter->take(word.strText);
        } catch (const BadValue& bad) {
            throw Failure(EXIT_STATUS_USAGE, word.pParameter->strName + ": " + bad.what());
        }
    }
}

void Command::take()
{
    check();
    takeWords();
}

std::string helpLine(const std::string& strName, const std::string& strDescription)
{
    const std::string strMargin(NAME_WIDTH + 2, ' ');
    std::string strLine = "  " + strName;
    if (strName.size() >= NAME_WIDTH) {
        return strLine + "\n" + wrapped(strMargin, strMargin, strDescription);
    }
    strLine.resize(strMargin.size(), ' ');
    return wrapped(strLine, strMargin, strDescription);
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
        const std::string strShort = 0 == each.cShort ? "" : std::string{'-', each.cShort, ','};
        const std::string strType = each.strType.empty() ? "" : " " + each.strType;
        strOptions += helpLine(strShort + each.strName + strType,
                               each.strDescription + (strNote.empty() ? "" : " (" + strNote.substr(2) + ")"));
    }
    std::string strExamples;
    for (const std::string& strExample : m_strExamples) {
        strExamples +=
            "  vemo-access-token " + m_strName + (strExample.empty() ? "" : " ") + strExample + "\n";
    }
    return strUsage + "\n" + wrapped("", "", m_strDescription) +
           (strArguments.empty() ? "" : "\nArguments:\n" + strArguments) + "\nOptions:\n" + strOptions +
           "\nExamples:\n" + strExamples;
}

} // namespace tool
