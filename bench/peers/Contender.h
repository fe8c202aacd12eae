// One way to store and grant tokens. Several are compared.
//
// A failure that is not a refusal throws std::runtime_error.

#ifndef VEMO_ACCESS_TOKEN_BENCH_CONTENDER_H
#define VEMO_ACCESS_TOKEN_BENCH_CONTENDER_H

#include <json/value.h>

#include <array>
#include <memory>
#include <string>

#include "BareEngine.h"

class Contender {
public:
    Contender() = default;
    virtual ~Contender() = default;
    Contender(const Contender&) = delete;
    Contender& operator=(const Contender&) = delete;

    // The number of tokens it holds.
    virtual int size() = 0;

    virtual void create(const BareToken& token) = 0;

    // Whether the bearer of the token may call the method of the web API: looks the token up, refuses
    // if it has expired or does not list the method, spends one use and deletes it with the last.
    virtual bool grant(std::string& strTid, const char* szWebapi, const char* szMethod) = 0;

    // The record that the last grant returned, with the uses left. After the last use it shows the count
    // before that.
    virtual Json::Value answer() const = 0;
};

// Tuned: with the write-ahead journal and the indexes that an administrator can make.
enum class Tuning { Plain, Tuned };
enum class Connection { PerCall, PerCallBesideAnother, Held };

// Make a contender with the tokens 0 to nTokens - 1 (tokenOf()). At most one for this library and one for
// each server may exist at a time. PerCallBesideAnother is for this library only: each call opens and closes
// the file while another process has it open.
std::unique_ptr<Contender> makeOurs(int nTokens, Tuning tuning, Connection connection);
std::unique_ptr<Contender> makeRedis(int nTokens, const char* szSocket, Connection connection);
std::unique_ptr<Contender> makePostgresql(int nTokens, const char* szServer, Connection connection);

// A token's values as texts, in the order of its fields.
typedef std::array<std::string, 9> Texts;

// The names of the fields.
const Texts& fieldNames();

Texts textsOf(const BareToken& token);

// The record with these texts.
Json::Value recordOf(const Texts& rgstrText);

#endif
