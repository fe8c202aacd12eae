#include "PlainReading.h"

#include <algorithm>

namespace {

using fuzz::Reading;
using fuzz::Texts;
typedef tool::Command::Parameter Parameter;

template <typename IsIt>
const Parameter* find(const std::vector<Parameter>& parameters, IsIt isIt)
{
    const auto pFound = std::find_if(parameters.begin(), parameters.end(), isIt);
    return parameters.end() == pFound ? nullptr : &*pFound;
}

bool add(const Parameter* pParameter, const std::string& strText, Reading& reading)
{
    if (!pParameter || (!pParameter->blRepeated && reading.count(pParameter->strName))) {
        return false;
    }
    reading[pParameter->strName].push_back(strText);
    return true;
}

// Reads the arguments that are left. Each function takes one or more from the beginning.
class Reader {
public:
    Reader(const tool::Command& command, const Texts& strArguments, Reading& reading)
        : m_command(command), m_strRest(strArguments.rbegin(), strArguments.rend()), m_reading(reading)
    {
    }

    bool readAll()
    {
        bool blOptions = true;
        while (!m_strRest.empty()) {
            const std::string strNext = takeNext();
            if (blOptions && strNext == "--") {
                blOptions = false;
            } else if (!(blOptions && strNext.size() > 1 && strNext[0] == '-' ? readOption(strNext)
                                                                              : readArgument(strNext))) {
                return false;
            }
        }
        return true;
    }

private:
    std::string takeNext()
    {
        const std::string strNext = m_strRest.back();
        m_strRest.pop_back();
        return strNext;
    }

    bool readArgument(const std::string& strText)
    {
        const auto isOpen = [&](const Parameter& each) {
            return each.blRepeated || !m_reading.count(each.strName);
        };
        return add(find(m_command.arguments(), isOpen), strText, m_reading);
    }

    bool readOption(const std::string& strNext)
    {
        return strNext[1] == '-' ? readLong(strNext) : readShort(strNext.substr(1));
    }

    // "--name=text", "--name text" or "--name"
    bool readLong(const std::string& strNext)
    {
        const size_t nEquals = strNext.find('=');
        const Parameter* pOption = find(m_command.options(), [&](const Parameter& each) {
            return each.strName == strNext.substr(0, nEquals);
        });
        if (pOption && std::string::npos != nEquals) {
            return !pOption->strType.empty() && add(pOption, strNext.substr(nEquals + 1), m_reading);
        }
        return addNext(pOption);
    }

    // "otext", "o text", "o" or several flags "ox", after the "-"
    bool readShort(const std::string& strLetters)
    {
        const Parameter* pOption = find(m_command.options(), [&](const Parameter& each) {
            return each.cShort && each.cShort == strLetters[0];
        });
        const std::string strMore = strLetters.substr(1);
        if (strMore.empty() || !pOption) {
            return addNext(pOption);
        }
        return !pOption->strType.empty() ? add(pOption, strMore, m_reading)
                                         : add(pOption, "", m_reading) && readShort(strMore);
    }

    // An option whose text, if it takes one, is the next argument.
    bool addNext(const Parameter* pOption)
    {
        if (!pOption || (!pOption->strType.empty() && m_strRest.empty())) {
            return false;
        }
        return add(pOption, pOption->strType.empty() ? "" : takeNext(), m_reading);
    }

    const tool::Command& m_command;
    Texts m_strRest; // the next one last
    Reading& m_reading;
};

} // namespace

namespace fuzz {

Reading readingOf(const tool::Command& command)
{
    Reading reading;
    for (const tool::Command::Word& word : command.words()) {
        reading[word.pParameter->strName].push_back(word.strText);
    }
    return reading;
}

bool readPlainly(const tool::Command& command, const Texts& strArguments, Reading& reading)
{
    return Reader(command, strArguments, reading).readAll();
}

} // namespace fuzz
