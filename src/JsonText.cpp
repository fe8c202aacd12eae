#include "internal/JsonText.h"

#include <json/reader.h>
#include <json/writer.h>

#include <memory>
#include <sstream>

#include "internal/ErrnoKeeper.h"

namespace {

std::unique_ptr<Json::StreamWriter> makeWriter()
{
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    builder["commentStyle"] = "None";
    builder["precision"] = 17;
    builder["useSpecialFloats"] = true;
    // The default escapes would replace what is not valid UTF-8.
    builder["emitUTF8"] = true;
    return std::unique_ptr<Json::StreamWriter>(builder.newStreamWriter());
}

std::unique_ptr<Json::CharReader> makeReader()
{
    Json::CharReaderBuilder builder;
    builder["collectComments"] = false;
    builder["allowSpecialFloats"] = true;
    return std::unique_ptr<Json::CharReader>(builder.newCharReader());
}

} // namespace

namespace VEMO_ACCESS_TOKEN {

// Writer and reader are built once per thread: building them costs more than the texts of a token.

std::string toString(const Json::Value& jValue)
{
    static thread_local const std::unique_ptr<Json::StreamWriter> pWriter = makeWriter();
    const ErrnoKeeper keeper;
    std::ostringstream stream;
    pWriter->write(jValue, &stream);
    return stream.str();
}

void fromString(const std::string& strText, Json::Value& jValue)
{
    static thread_local const std::unique_ptr<Json::CharReader> pReader = makeReader();
    try {
        pReader->parse(strText.data(), strText.data() + strText.size(), &jValue, nullptr);
    } catch (const Json::Exception&) {
        // Nested beyond the reader's limit. What was read stands, as after any other bad text.
    }
}

} // namespace VEMO_ACCESS_TOKEN
