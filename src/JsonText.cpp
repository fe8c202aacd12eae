#include "internal/JsonText.h"

#include <json/reader.h>
#include <json/writer.h>
#include <pthread.h>

#include <climits>
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
    // Without this the stream would cut the text short when memory runs out, and report nothing.
    pStream->exceptions(std::ios_base::badbit);
    return pStream;
}

// A writer and a reader. To make them costs more than to write and to read a token.
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
            // Parsed twice before it counts as bad: when memory runs out, the reader rejects valid numbers.
            parse(strText, jValue) || parse(strText, jValue);
        } catch (const Json::RuntimeError& error) {
            // A text with too many levels is bad, and what was read of it is kept. The same exception can
            // mean that memory ran out, and then half a value must not pass for the whole one.
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

// The key of the per-thread codec. (For a thread_local object the C library registers a destructor, and ends
// the process when there is no memory for that.)
pthread_key_t codecKey()
{
    static const pthread_key_t key = [] {
        pthread_key_t made = PTHREAD_KEYS_MAX; // not a key, and stays so when the process has no key left
        pthread_key_create(&made, [](void* pCodec) { delete static_cast<Codec*>(pCodec); });
        return made;
    }();
    return key;
}

// This thread's codec, made at its first use. When the thread cannot keep it, each use has its own codec.
class ThreadCodec {
public:
    ThreadCodec() : m_pCodec(static_cast<Codec*>(pthread_getspecific(codecKey())))
    {
        if (!m_pCodec) {
            m_pOwn = std::make_unique<Codec>();
            m_pCodec = m_pOwn.get();
            if (0 == pthread_setspecific(codecKey(), m_pCodec)) {
                static_cast<void>(m_pOwn.release());
            }
        }
    }
    Codec* operator->() const { return m_pCodec; }

private:
    Codec* m_pCodec;
    std::unique_ptr<Codec> m_pOwn;
};

} // namespace

namespace VEMO_ACCESS_TOKEN {

std::string toString(const Json::Value& jValue)
{
    if (jValue.isObject() && jValue.empty()) {
        return "{}"; // the most frequent value
    }
    const ErrnoKeeper keeper;
    return ThreadCodec()->write(jValue);
}

void fromString(std::string_view strText, Json::Value& jValue)
{
    if (strText == "{}") {
        jValue = Json::Value(Json::objectValue);
        return;
    }
    ThreadCodec()->read(strText, jValue);
}

} // namespace VEMO_ACCESS_TOKEN
