// The tool under the fuzzer, the store that it uses and the directory that it runs in. Each run finds them
// the same.

#ifndef FUZZ_TOOL_STORE_H
#define FUZZ_TOOL_STORE_H

#include <dirent.h>
#include <getopt.h>

#include <cstdio>
#include <cstring>
#include <filesystem>
#include <iostream>
#include <sstream>
#include <string>
#include <vector>

#include "AccessTokenUtil.h"
#include "Commands.h"
#include "Console.h"
#include "Failure.h"
#include "Interpose.h"
#include "Library.h"

namespace fuzz {

typedef std::vector<std::string> Texts;

// The beginnings of ids, and fields that differ from their defaults.
const char* const TOKENS[] = {
    R"({"tid":"LiveToken","bind_sid":"sid","uid":0,"deadline":4102444800,"count":3,"function":"backup",)"
    R"("webapi_allow":{"Example.File":{"method":["get","list"]}},"extra":{"note":"\u001b[31m"}})",
    R"({"tid":"LastUseOf","uid":1000,"deadline":4102444800,"function":"share","webapi_allow":{"A":{}}})",
    R"({"tid":"Malformed","uid":-5,"deadline":9223372036854775807,"count":-1,"function":"share",)"
    R"("webapi_allow":{"A":{"method":[[]]},"B":[]}})",
    R"({"tid":"ExpiredIt","bind_sid":"sid","uid":77,"deadline":1,"count":0,"function":"old"})"};

// An id of 127 characters with this beginning.
inline std::string tid(const std::string& strStart)
{
    return strStart + std::string(VEMO_ATOKEN_LENGTH_MIN - strStart.size(), 'f');
}

class ToolStore {
public:
    // Of the files in the directory.
    explicit ToolStore(const Files& inputs) : m_inputs(inputs)
    {
        FUZZ_REQUIRE(freopen("/dev/null", "r", stdin) && freopen("/dev/null", "w", stdout));
        stderr = m_pComplaints;
        AccessTokenDbApi db;
        for (const char* szToken : TOKENS) {
            Json::Value jToken = json(szToken);
            jToken["tid"] = tid(jToken["tid"].asString());
            jToken["create_time"] = 1;
            VEMO_ACCESS_TOKEN::fillDefaultValue(jToken, false);
            FUZZ_REQUIRE(0 == db.tokenCreate(jToken));
        }
        m_first = m_store.files();
        restore();
    }
    ToolStore(const ToolStore&) = delete;
    ToolStore& operator=(const ToolStore&) = delete;

    // Runs the tool with these arguments; the first is the name of the program. Returns its exit status.
    // Exceptions other than tool::Failure pass through, and end the fuzzing.
    int run(tool::Commands& commands, Texts strArguments, const std::string& strInput)
    {
        std::vector<char*> rgArguments;
        for (std::string& strArgument : strArguments) {
            rgArguments.push_back(strArgument.data());
        }
        const std::filesystem::path before = std::filesystem::current_path();
        std::filesystem::current_path(m_directory.directory());
        std::stringbuf input(strInput);
        std::streambuf* const pBefore = std::cin.rdbuf(&input);
        int nStatus = tool::EXIT_STATUS_DONE;
        optind = 0; // 0, unlike 1, resets getopt_long() completely
        try {
            nStatus = commands.run(static_cast<int>(rgArguments.size()), rgArguments.data());
        } catch (const tool::Failure& failure) {
            tool::complain(failure.what());
            nStatus = failure.status();
        }
        std::cin.rdbuf(pBefore);
        std::filesystem::current_path(before);
        return nStatus;
    }

    // What the tool has written to standard error since the last call.
    std::string takeComplaints()
    {
        fflush(m_pComplaints);
        const std::string strTaken(m_szComplaints, m_cbComplaints);
        rewind(m_pComplaints);
        return strTaken;
    }

    Files files() const { return m_directory.files(); }

    // Whether the database differs from its first state.
    bool isChanged() const { return m_store.files() != m_first; }

    // Its tokens. The database must be sound.
    Json::Value tokens() const
    {
        FUZZ_REQUIRE("ok\n" == m_store.rows("PRAGMA integrity_check"));
        return fuzz::tokens();
    }

    // Deletes all tokens.
    void clear() const { m_store.run("DELETE FROM token"); }

    void restore() const
    {
        m_store.setFiles(m_first);
        m_directory.setFiles(m_inputs);
    }

private:
    const TokenStore m_directory;
    const TokenStore m_store; // the tool uses it, because it is the newer store
    const Files m_inputs;
    Files m_first;
    char* m_szComplaints = nullptr;
    size_t m_cbComplaints = 0;
    FILE* m_pComplaints = open_memstream(&m_szComplaints, &m_cbComplaints);
};

} // namespace fuzz

// Reading about all processes of the machine takes long, and depends on them.
extern "C" INTERPOSED DIR* opendir(const char* szPath)
{
    return 0 == strcmp(szPath, "/proc") || 0 == strcmp(szPath, "/proc/") ? nullptr : NEXT(opendir)(szPath);
}

#endif
