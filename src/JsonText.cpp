#include "internal/JsonText.h"

#include <json/reader.h>
#include <json/writer.h>

#include <memory>
#include <sstream>

#include "internal/ErrnoKeeper.h"

namespace {

// The two configurations are built once and never destroyed, so that a program may still use the
// library while it exits.

const Json::StreamWriterBuilder* makeWriterBuilder()
{
    auto pBuilder = std::make_unique<Json::StreamWriterBuilder>();
    (*pBuilder)["indentation"] = "";
    (*pBuilder)["commentStyle"] = "None";
    (*pBuilder)["precision"] = 17;
    (*pBuilder)["useSpecialFloats"] = true;
    // The default escapes would replace what is not valid UTF-8.
    (*pBuilder)["emitUTF8"] = true;
    return pBuilder.release();
}

const Json::CharReaderBuilder* makeReaderBuilder()
{
    auto pBuilder = std::make_unique<Json::CharReaderBuilder>();
    (*pBuilder)["collectComments"] = false;
    (*pBuilder)["allowSpecialFloats"] = true;
    return pBuilder.release();
}

} // namespace

namespace VEMO_ACCESS_TOKEN {

std::string toString(const Json::Value& jValue)
{
    const ErrnoKeeper keeper;
    static const Json::StreamWriterBuilder* pBuilder = makeWriterBuilder();
    const std::unique_ptr<Json::StreamWriter> pWriter(pBuilder->newStreamWriter());
    std::ostringstream stream;
    pWriter->write(jValue, &stream);
    return stream.str();
}

void fromString(const std::string& strText, Json::Value& jValue)
{
    static const Json::CharReaderBuilder* pBuilder = makeReaderBuilder();
    const std::unique_ptr<Json::CharReader> pReader(pBuilder->newCharReader());
    try {
        pReader->parse(strText.data(), strText.data() + strText.size(), &jValue, nullptr);
    } catch (const Json::Exception&) {
        // Nested beyond the reader's limit. What was read stands, as after any other bad text.
    }
}

} // namespace VEMO_ACCESS_TOKEN
