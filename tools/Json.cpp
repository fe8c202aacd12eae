#include "Json.h"

#include <json/writer.h>

#include <algorithm>
#include <cstring>
#include <sstream>

#include "Failure.h"
#include "Masking.h"
#include "Visible.h"

namespace {

class Writer {
public:
    explicit Writer(const char* szIndentation)
    {
        Json::StreamWriterBuilder builder;
        builder["indentation"] = szIndentation;
        // Writes all that the store can hold: doubles without a form in JSON (NaN, infinity), and bytes that
        // are not valid UTF-8. Doubles have all their digits by default.
        builder["useSpecialFloats"] = true;
        builder["emitUTF8"] = true;
        m_pWriter.reset(builder.newStreamWriter());
        m_stream.exceptions(
            std::ios_base::badbit); // else lack of memory would go unnoticed and shorten the text
    }

    std::string write(const Json::Value& jValue)
    {
        m_stream.clear();
        m_stream.str(std::string());
        m_pWriter->write(jValue, &m_stream);
        return tool::visibleJson(m_stream.str());
    }

private:
    std::unique_ptr<Json::StreamWriter> m_pWriter;
    std::ostringstream m_stream; // reused: making one takes as long as writing a token
};

std::unique_ptr<Json::CharReader> makeReader(int nNestedMax)
{
    Json::CharReaderBuilder builder;
    Json::CharReaderBuilder::strictMode(&builder.settings_);
    builder["allowSpecialFloats"] = true; // compactJson() writes them
    builder["stackLimit"] = nNestedMax;
    return std::unique_ptr<Json::CharReader>(builder.newCharReader());
}

// The first error of the reader's report, as one line. In the report, "*" begins an error of several lines.
std::string firstError(const std::string& strReport)
{
    std::istringstream words(strReport);
    words.exceptions(std::ios_base::badbit);
    std::string strError;
    for (std::string strWord; words >> strWord && (strWord != "*" || strError.empty());) {
        strError += strWord == "*" ? "" : (strError.empty() ? "" : " ") + strWord;
    }
    const std::string strFirstLine = "Line 1, "; // needless where there is only one line
    return 0 == strError.compare(0, strFirstLine.size(), strFirstLine) ? strError.substr(strFirstLine.size())
                                                                       : strError;
}

enum class Reading { Whole, Bad, TooDeep };

Reading readBy(Json::CharReader& reader, const std::string& strText, Json::Value& jValue,
               std::string& strReport)
{
    const auto parse = [&] {
        return reader.parse(strText.data(), strText.data() + strText.size(), &jValue, &strReport);
    };
    try {
        // Parses twice, because the reader rejects valid numbers when memory runs out.
        return parse() || parse() ? Reading::Whole : Reading::Bad;
    } catch (const Json::RuntimeError& error) {
        if (!strstr(error.what(), "stackLimit")) {
            throw; // memory ran out
        }
        return Reading::TooDeep;
    }
}

} // namespace

namespace tool {

Json::Value parseObject(const std::string& strText, int nNestedMax)
{
    return ObjectReader(nNestedMax).read(strText);
}

ObjectReader::ObjectReader(int nNestedMax) : m_pReader(makeReader(nNestedMax)) {}

Json::Value ObjectReader::read(const std::string& strText) const
{
    Json::Value jValue;
    std::string strReport;
    switch (readBy(*m_pReader, strText, jValue, strReport)) {
    case Reading::Whole: break;
    case Reading::Bad: throw BadValue("is not JSON: " + shownReason(firstError(strReport)));
    case Reading::TooDeep: throw BadValue("is nested too deeply for JSON");
    }
    if (!jValue.isObject()) {
        throw BadValue("is not a JSON object");
    }
    return jValue;
}

std::string flawOfStored(const std::string& strText)
{
    static const std::unique_ptr<Json::CharReader> pReader = [] {
        Json::CharReaderBuilder builder; // as lenient as the library's reader
        builder["allowSpecialFloats"] = true;
        return std::unique_ptr<Json::CharReader>(builder.newCharReader());
    }();
    Json::Value jValue;
    std::string strReport;
    const Reading reading = readBy(*pReader, strText, jValue, strReport);
    return Reading::Whole == reading ? "" : Reading::Bad == reading ? "is not JSON" : "is nested too deeply";
}

int nestingOf(const std::string& strText)
{
    int nLevel = 0;
    int nDeepest = 0;
    bool blString = false;
    for (size_t i = 0; i < strText.size(); ++i) {
        const char c = strText[i];
        if (blString) {
            blString = c != '"';
            i += c == '\\' ? 1 : 0;
        } else if (c == '"') {
            blString = true;
        } else if (c == '{' || c == '[') {
            nDeepest = std::max(nDeepest, ++nLevel);
        } else if (c == '}' || c == ']') {
            --nLevel;
        }
    }
    return nDeepest;
}

std::string compactJson(const Json::Value& jValue)
{
    static Writer writer("");
    return writer.write(jValue);
}

std::string styledJson(const Json::Value& jValue)
{
    static Writer writer("  ");
    return writer.write(jValue);
}

} // namespace tool
