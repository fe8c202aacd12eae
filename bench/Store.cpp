#include "Store.h"

#include <cerrno>
#include <cstdlib>
#include <ctime>
#include <filesystem>
#include <random>
#include <system_error>

#include "AccessTokenApi.h"

namespace {

const char* baseOf(Place place)
{
    const bool blMemory = Place::Memory == place;
    const char* szBase = getenv(blMemory ? "VEMO_BENCH_MEMORY" : "VEMO_BENCH_DISK");
    return szBase ? szBase : blMemory ? "/dev/shm" : "/var/tmp";
}

std::string randomText(std::mt19937& source, size_t cchText)
{
    const char szAlphabet[] = "0987654321abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ";
    std::uniform_int_distribution<size_t> draw(0, sizeof(szAlphabet) - 2);
    std::string strText;
    while (strText.size() < cchText) {
        strText += szAlphabet[draw(source)];
    }
    return strText;
}

} // namespace

const char* nameOf(Place place)
{
    return Place::Memory == place ? "memory" : "disk";
}

Store::Store(Place place, int nTokens, const std::string& strTuning)
{
    std::string strTemplate = std::string(baseOf(place)) + "/vemo-bench-XXXXXX";
    if (!mkdtemp(strTemplate.data())) {
        throw std::system_error(errno, std::generic_category(), strTemplate);
    }
    m_strDirectory = strTemplate;
    use();
    AccessTokenApi(); // makes the database
    BareEngine engine;
    engine.run("PRAGMA cache_size = -2000000; BEGIN;");
    for (int nToken = 0; nToken < nTokens; ++nToken) {
        engine.create(tokenOf(nToken));
    }
    engine.run(("COMMIT;" + strTuning).c_str());
}

Store::~Store()
{
    std::filesystem::remove_all(m_strDirectory);
    std::filesystem::remove(m_strDirectory + ".lock"); // of the redirected lock of all programs
}

void Store::use() const
{
    setenv("VEMO_REDIRECT_DIR", m_strDirectory.c_str(), 1);
}

BareToken tokenOf(int nNumber)
{
    std::mt19937 source(static_cast<unsigned int>(nNumber));
    const long long nNow = time(nullptr);
    BareToken token;
    token.strTid = randomText(source, 127 + source() % 129);
    token.strBindSid = randomText(source, 32);
    token.nUid = 1000 + nNumber % 10;
    token.nDeadline = nNow + 86400 + nNumber / 10;
    token.nCount = 1000000;
    token.nCreateTime = nNow;
    token.strFunction = "purpose-" + std::to_string(nNumber % 100);
    token.strWebapiAllow = R"({"Example.File":{"method":["get","list"]}})";
    token.strExtra = "{}";
    return token;
}

std::map<std::string, std::string> fieldsOf(const BareToken& token)
{
    return {{"tid", token.strTid},
            {"bind_sid", token.strBindSid},
            {"uid", std::to_string(token.nUid)},
            {"deadline", std::to_string(token.nDeadline)},
            {"count", std::to_string(token.nCount)},
            {"create_time", std::to_string(token.nCreateTime)},
            {"function", token.strFunction},
            {"webapi_allow", token.strWebapiAllow},
            {"extra", token.strExtra}};
}
