#include "internal/JsonText.h"

#include <json/reader.h>
#include <json/writer.h>

#include <cstring>
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
    Codec() : m_pWriter(makeWriter()), m_pReader(makeReader()) {}

    std::string write(const Json::Value& jValue)
    {
        // Kept for the next text, unless it has grown too much or failed.
        std::unique_ptr<std::ostringstream> pStream = m_pStream ? std::move(m_pStream) : makeStream();
        m_pWriter->write(jValue, pStream.get());
        std::string strText = pStream->str();
        if (strText.size() <= KEPT_MAX) {
            pStream->str(std::string());
            m_pStream = std::move(pStream);
        }
        return strText;
    }

    void read(std::string_view strText, Json::Value& jValue)
    {
        try {
            // A text is bad when it is so twice: the reader takes a number for none when memory runs out.
            parse(strText, jValue) || parse(strText, jValue);
        } catch (const Json::RuntimeError& error) {
            // Nested beyond the reader's limit: what was read stands, as after any other bad text. The
            // same exception says that memory ran out, and then half a value must not pass for the whole.
            if (!strstr(error.what(), "stackLimit")) {
                throw;
            }
        }
    }

private:
    bool parse(std::string_view strText, Json::Value& jValue)
    {
        jValue = Json::Value();
        return m_pReader->parse(strText.data(), strText.data() + strText.size(), &jValue, nullptr);
    }

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
