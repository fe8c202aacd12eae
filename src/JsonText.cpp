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

std::unique_ptr<std::ostringstream> makeStream()
{
    auto pStream = std::make_unique<std::ostringstream>();
    // A stream would hide that its memory ran out, and the text would be cut short.
    pStream->exceptions(std::ios_base::badbit);
    return pStream;
}

// A writer and a reader, which cost more to make than a token's texts to write and to read.
class Codec {
public:
    Codec() : m_pWriter(makeWriter()), m_pReader(makeReader()), m_pStream(makeStream()) {}

    std::string write(const Json::Value& jValue)
    {
        m_pStream->clear();
        m_pStream->str(std::string());
        m_pWriter->write(jValue, m_pStream.get());
        std::string strText = m_pStream->str();
        if (KEPT_MAX < strText.size()) {
            m_pStream = makeStream();
        }
        return strText;
    }

    void read(std::string_view strText, Json::Value& jValue)
    {
        jValue = Json::Value();
        try {
            m_pReader->parse(strText.data(), strText.data() + strText.size(), &jValue, nullptr);
        } catch (const Json::Exception&) {
            // Nested beyond the reader's limit. What was read stands, as after any other bad text.
        }
    }

private:
    static constexpr size_t KEPT_MAX = 4096; // the longest text whose memory is kept for the next

    const std::unique_ptr<Json::StreamWriter> m_pWriter;
    const std::unique_ptr<Json::CharReader> m_pReader;
    std::unique_ptr<std::ostringstream> m_pStream;
};

// Set when the thread has destroyed its codec. It needs no destruction itself, so it can be read to
// the very end.
thread_local bool t_blEnded = false;

struct ThreadCodec : Codec {
    ~ThreadCodec() { t_blEnded = true; }
};

// Each thread keeps a codec. What still runs when it is gone, such as an exit handler, gets one of
// its own.
template <typename Use>
auto withCodec(Use use)
{
    if (t_blEnded) {
        Codec codec;
        return use(codec);
    }
    thread_local ThreadCodec codec;
    return use(codec);
}

} // namespace

namespace VEMO_ACCESS_TOKEN {

std::string toString(const Json::Value& jValue)
{
    if (jValue.isObject() && jValue.empty()) {
        return "{}"; // what most tokens hold in a field
    }
    const ErrnoKeeper keeper;
    return withCodec([&](Codec& codec) { return codec.write(jValue); });
}

void fromString(std::string_view strText, Json::Value& jValue)
{
    if (strText == "{}") {
        jValue = Json::Value(Json::objectValue);
        return;
    }
    withCodec([&](Codec& codec) { codec.read(strText, jValue); });
}

} // namespace VEMO_ACCESS_TOKEN
