#include <gtest/gtest.h>

#include <regex>

#include "gate/Clock.h"
#include "gate/http/Call.h"
#include "gate/http/Head.h"
#include "gate/http/Repeats.h"
#include "gate/http/Response.h"

using gate::Answer;
using gate::Call;
using gate::Head;
using gate::Manner;
using gate::Outcome;
using gate::Reading;
using gate::Repeats;
using namespace std::string_literals;

namespace {

const std::string LINE = "GET /grant/Api/get HTTP/1.1\r\n";
const std::string HOST = "Host: gate\r\n";

// A request with these headers.
std::string with(const std::string& strHeaders)
{
    return LINE + HOST + strHeaders + "\r\n";
}

std::string lineOf(size_t cbLine)
{
    const std::string strEnds = "GET / HTTP/1.1";
    return "GET /" + std::string(cbLine - strEnds.size(), 'x') + " HTTP/1.1\r\n";
}

std::string headOf(size_t cbHead)
{
    const std::string strEmpty = with("X: \r\n");
    return with("X: " + std::string(cbHead - strEmpty.size(), 'x') + "\r\n");
}

std::string headers(size_t nNumber)
{
    std::string strHeaders;
    for (size_t i = 0; i < nNumber; ++i) {
        strHeaders += "X: 1\r\n";
    }
    return strHeaders;
}

// How a head is read, in words.
std::string read(std::string_view strBytes, size_t& cbSeen)
{
    Head head;
    size_t cbHead = 0;
    switch (gate::readHead(strBytes, cbSeen, head, cbHead)) {
    case Reading::Incomplete: return "incomplete";
    case Reading::BadRequest: return "400";
    case Reading::TargetTooLong: return "414";
    case Reading::HeadTooLarge: return "431";
    case Reading::Whole: break;
    }
    EXPECT_EQ(strBytes.find("\r\n\r\n") + 4, cbHead);
    return std::string(head.blKeepAlive ? "keep" : "close") + (head.blBody ? " body" : "") +
           (head.blOld ? " old" : "");
}

const struct {
    std::string strBytes;
    const char* szRead;
} HEADS[] = {
    {"", "incomplete"},
    {LINE + HOST + "\r", "incomplete"},
    {with(""), "keep"},
    {with("") + "\0what follows"s, "keep"},
    {"GET / HTTP/1.0\r\n\r\n", "close old"},
    {"GET / HTTP/1.0\r\nConnection: Keep-Alive\r\n\r\n", "keep old"},
    {with("Connection: close\r\n"), "close"},
    {with("Connection: x,\tCLOSE ,y\r\n"), "close"},
    {with("Connection: keep-alive\r\nConnection: close\r\n"), "close"},
    {with("Connection: closed, x-close\r\n"), "keep"},
    {LINE + "\r\n", "400"},
    {LINE + HOST + HOST + "\r\n", "400"},
    {"\r\n" + with(""), "400"},
    {" " + with(""), "400"},
    {"\x16\x03\x01", "400"},
    {LINE + "Host: gate\n\r\n", "400"},
    {LINE + "Host: ga\rte\r\n\r\n", "400"},
    {LINE + "Host: gate\r\r\n\r\n", "400"},
    {"GET /grant/Api HTTP/1.1\n", "400"},
    {with("X: 1\r\n 2\r\n"), "400"},
    {with(" X: 1\r\n"), "400"},
    {with("X : 1\r\n"), "400"},
    {with("X\r\n"), "400"},
    {with(": 1\r\n"), "400"},
    {with("X\x80: 1\r\n"), "400"},
    {with("X: \x80\t\xff\r\n"), "keep"},
    {with("X: \x01\r\n"), "400"},
    {with("X: \x7f\r\n"), "400"},
    {with("X: \0\r\n"s), "400"},
    {"GET /\0 HTTP/1.1\r\n"s + HOST + "\r\n", "400"},
    {"GET /\t HTTP/1.1\r\n" + HOST + "\r\n", "400"},
    {"GET  / HTTP/1.1\r\n" + HOST + "\r\n", "400"},
    {"GET / HTTP/1.1 \r\n" + HOST + "\r\n", "400"},
    {"GET / HTTP/1.2\r\n" + HOST + "\r\n", "400"},
    {"GET / http/1.1\r\n" + HOST + "\r\n", "400"},
    {"GET /\r\n\r\n", "400"},
    {"GET\r\n\r\n", "400"},
    {"G(T / HTTP/1.1\r\n" + HOST + "\r\n", "400"},
    {with("Content-Length: 0\r\n"), "keep"},
    {with("Content-Length: 000\r\n"), "keep"},
    {with("Content-Length: 10\r\n"), "close body"},
    {with("Content-Length: 999999999999999999\r\n"), "close body"},
    {with("Content-Length: 1000000000000000000\r\n"), "400"},
    {with("Content-Length: 1\r\nContent-Length: 1\r\n"), "400"},
    {with("Content-Length: 1, 1\r\n"), "400"},
    {with("Content-Length: +1\r\n"), "400"},
    {with("Content-Length: -1\r\n"), "400"},
    {with("Content-Length: 0x1\r\n"), "400"},
    {with("Content-Length: 1 0\r\n"), "400"},
    {with("Content-Length:\r\n"), "400"},
    {with("Transfer-Encoding: chunked\r\n"), "close body"},
    {with("transfer-encoding:CHUNKED \r\n"), "close body"},
    {with("Transfer-Encoding: identity\r\n"), "400"},
    {with("Transfer-Encoding: gzip, chunked\r\n"), "400"},
    {with("Transfer-Encoding: chunked, chunked\r\n"), "400"},
    {with("Transfer-Encoding: chunked;x=1\r\n"), "400"},
    {with("Transfer-Encoding: chunked\r\nTransfer-Encoding: chunked\r\n"), "400"},
    {with("Transfer-Encoding: chunked\r\nContent-Length: 0\r\n"), "400"},
    {with("Transfer-Encoding:\r\n"), "400"},
    {"GET / HTTP/1.0\r\nTransfer-Encoding: chunked\r\n\r\n", "400"},
    {lineOf(gate::LINE_MAX_BYTES) + HOST + "\r\n", "keep"},
    {lineOf(gate::LINE_MAX_BYTES + 1) + HOST + "\r\n", "414"},
    {lineOf(gate::LINE_MAX_BYTES + 1) + "\n", "414"},
    {std::string(gate::LINE_MAX_BYTES, 'x') + "\n", "400"},
    {headOf(gate::HEAD_MAX_BYTES), "keep"},
    {headOf(gate::HEAD_MAX_BYTES + 1), "431"},
    {headOf(gate::HEAD_MAX_BYTES + 1) + "\n", "431"},
    {LINE + HOST + headers(gate::HEADERS_MAX - 1) + "\r\n", "keep"},
    {LINE + HOST + headers(gate::HEADERS_MAX) + "\r\n", "431"},
};

} // namespace

TEST(Head, IsReadStrictly)
{
    for (const auto& row : HEADS) {
        size_t cbSeen = 0;
        EXPECT_EQ(row.szRead, read(row.strBytes, cbSeen)) << row.strBytes.substr(0, 200);
    }
}

TEST(Head, IsReadAlikeHoweverItComes)
{
    for (const auto& row : HEADS) {
        const std::string_view strBytes = row.strBytes;
        const size_t nStep = strBytes.size() > 1000 ? 61 : 1;
        size_t cbSeen = 0;
        std::string strRead;
        for (size_t cb = 0; cb < strBytes.size() + nStep; cb += nStep) {
            strRead = read(strBytes.substr(0, cb), cbSeen);
            if (strRead != "incomplete") {
                break;
            }
        }
        EXPECT_EQ(row.szRead, strRead) << strBytes.substr(0, 200);
    }
}

TEST(Head, HasItsHeadersByName)
{
    const std::string strBytes =
        with("ACCEPT: a , b;q=1,\tText/C \r\nx: first\r\nX:\t second\t\r\nEmpty:\r\naccept:d\r\n");
    size_t cbSeen = 0;
    size_t cbHead = 0;
    Head head;
    ASSERT_EQ(Reading::Whole, gate::readHead(strBytes, cbSeen, head, cbHead));
    EXPECT_EQ("GET", head.strMethod);
    EXPECT_EQ("/grant/Api/get", head.strTarget);
    EXPECT_EQ(2U, head.count("x"));
    EXPECT_EQ("first", head.value("x"));
    EXPECT_EQ("second", head.headers[3].strValue);
    EXPECT_EQ(1U, head.count("empty"));
    EXPECT_EQ("", head.value("empty"));
    EXPECT_EQ(0U, head.count("none"));
    EXPECT_EQ("", head.value("none"));
    for (const char* szElement : {"a", "b", "text/c", "d"}) {
        EXPECT_TRUE(head.lists("accept", szElement)) << szElement;
    }
    for (const char* szElement : {"", "text/", "q=1", "first"}) {
        EXPECT_FALSE(head.lists("accept", szElement)) << szElement;
    }
}

TEST(Call, IsReadFromTargetAndHeaders)
{
    const std::string strId = "Authorization: Bearer id\r\n";
    const std::string strLong(gate::API_MAX, 'a');
    const struct {
        std::string strTarget;
        std::string strHeaders;
        std::string strRead; // a status, or the call
    } CALLS[] = {
        {"/grant/Api", strId, "id|Api||"},
        {"/grant/Api/get", strId, "id|Api|get|"},
        {"/grant/Api/get/", strId, "id|Api|get|"},
        {"/grant/Api/get/more/../%00//", strId, "id|Api|get|"},
        {"/grant/Api?/get", strId, "id|Api||"},
        {"/grant/%41pi/g%65%74%20%2b+?x=%zz", strId, "id|Api|get ++|"},
        {"/grant/%252F/%25", strId, "id|%2F|%|"},
        {"/grant/\xc3\xa4/%C3%a4", strId, "id|\xc3\xa4|\xc3\xa4|"},
        {"/grant/.../..%20", strId, "id|...|.. |"},
        {"/grant/" + strLong + "/" + strLong, strId, "id|" + strLong + "|" + strLong + "|"},
        {"/grant/" + strLong + "a", strId, "414"},
        {"/grant/Api/a" + strLong, strId, "414"},
        {"/grant", strId, "400"},
        {"/grant/", strId, "400"},
        {"/grant/?x", strId, "400"},
        {"/grant//get", strId, "400"},
        // The API alone would allow more than a method.
        {"/grant/Api/", strId, "400"},
        {"/grant/Api//get", strId, "400"},
        {"/grant/Api/?get", strId, "400"},
        {"/Grant/Api", strId, "400"},
        {"//grant/Api", strId, "400"},
        {"*", strId, "400"},
        {"http://gate/grant/Api", strId, "400"},
        {"/grant/Api#get", strId, "400"},
        {"/grant/Api/get?x#y", strId, "400"},
        {"/grant/./get", strId, "400"},
        {"/grant/../get", strId, "400"},
        {"/grant/Api/..", strId, "400"},
        {"/grant/Api/%2e%2E/x", strId, "400"},
        {"/grant/Api/.", strId, "400"},
        {"/grant/Api%00", strId, "400"},
        {"/grant/Api%2Fget", strId, "400"},
        {"/grant/Api/%2f", strId, "400"},
        {"/grant/Api%", strId, "400"},
        {"/grant/Api%4", strId, "400"},
        {"/grant/Api%4/1", strId, "400"},
        {"/grant/Api%4g", strId, "400"},
        {"/grant/Api%-1", strId, "400"},
        {"/grant/Api", "", "401"},
        {"/grant/Api", "Authorization:\r\n", "401"},
        {"/grant/Api", "Authorization: Bearer\r\n", "401"},
        {"/grant/Api", "Authorization: Bearer\tid\r\n", "401"},
        {"/grant/Api", "Authorization: Bearerid\r\n", "401"},
        {"/grant/Api", "Authorization: Basic id\r\n", "401"},
        {"/grant/Api", "Authorization: id\r\n", "401"},
        {"/grant/Api", "Proxy-Authorization: Bearer id\r\n", "401"},
        {"/grant/Api", strId + strId, "400"},
        {"/grant/Api", "AUTHORIZATION: \tbEARER   id \r\n", "id|Api||"},
        {"/grant/Api", "Authorization: Bearer i d\r\n", "403"},
        {"/grant/Api", "Authorization: Bearer id, id\r\n", "403"},
        {"/grant/Api", "Authorization: Bearer " + std::string(1024, 'i') + "\r\n",
         std::string(1024, 'i') + "|Api||"},
        {"/grant/Api", "Authorization: Bearer " + std::string(1025, 'i') + "\r\n", "403"},
        {"/grant/Api", strId + "Accept: application/json\r\n", "id|Api||record"},
        {"/grant/Api", strId + "Accept: text/*\r\nAccept: a/b, Application/JSON;q=0.5\r\n", "id|Api||record"},
        {"/grant/Api", strId + "Accept: application/jsonlines, */*\r\n", "id|Api||"},
        {"/grant/Api", strId + "X-Once: key\r\n", "id|Api||key"},
        {"/grant/Api", strId + "x-once:\r\n", "id|Api||"},
        {"/grant/Api", strId + "X-Once: " + std::string(128, 'k') + "\r\n",
         "id|Api||" + std::string(128, 'k')},
        {"/grant/Api", strId + "X-Once: " + std::string(129, 'k') + "\r\n", "400"},
        {"/grant/Api", strId + "X-Once: key\r\nX-Once: key\r\n", "400"},
    };
    for (const auto& row : CALLS) {
        const std::string strBytes =
            "POST " + row.strTarget + " HTTP/1.1\r\n" + HOST + row.strHeaders + "\r\n";
        size_t cbSeen = 0;
        size_t cbHead = 0;
        Head head;
        ASSERT_EQ(Reading::Whole, gate::readHead(strBytes, cbSeen, head, cbHead)) << strBytes;
        Call call;
        const int nStatus = gate::readCall(head, "x-once", call);
        const std::string strCall = call.strTid + "|" + call.strApi + "|" + call.strMethod + "|" +
                                    call.strOnce + (call.blRecord ? "record" : "");
        EXPECT_EQ(row.strRead, nStatus ? std::to_string(nStatus) : strCall) << strBytes;
    }
}

TEST(Call, HasNoMethodThatOpensTunnelsOrEchoes)
{
    for (const char* szMethod : {"CONNECT", "TRACE"}) {
        Head head;
        head.strMethod = szMethod;
        Call call;
        EXPECT_EQ(405, gate::readCall(head, "", call));
    }
}

namespace {

// A response without its date.
std::string dateless(const std::string& strResponse)
{
    static const std::regex date("Date: [A-Z][a-z]{2}, [0-9]{2} [A-Z][a-z]{2} [0-9]{4} [0-9:]{8} GMT\r\n");
    return std::regex_replace(strResponse, date, "D\r\n");
}

} // namespace

TEST(Response, TellsWhoseTokenItIs)
{
    Answer answer;
    answer.nUid = 4294967294;
    answer.strUser = "a b%\r\n\x7f\xc3\xa4";
    answer.strFunction = "VPN";
    const std::string strBegin =
        "HTTP/1.1 200 OK\r\nD\r\nX-Token-User: a%20b%25%0D%0A%7F%C3%A4\r\n"
        "X-Token-Uid: 4294967294\r\nX-Token-Function: VPN\r\nCache-Control: no-store\r\n";
    EXPECT_EQ(strBegin + "Content-Length: 0\r\n\r\n",
              dateless(gate::grantedResponse(answer, {true, false, false})));
    answer.strRecord = "{}\n";
    const std::string strBody = strBegin + "Content-Type: application/json\r\nContent-Length: 3\r\n";
    EXPECT_EQ(strBody + "\r\n{}\n", dateless(gate::grantedResponse(answer, {true, false, false})));
    EXPECT_EQ(strBody + "\r\n", dateless(gate::grantedResponse(answer, {true, true, false})));
    EXPECT_EQ(strBody + "Connection: keep-alive\r\n\r\n{}\n",
              dateless(gate::grantedResponse(answer, {true, false, true})));
    EXPECT_EQ(strBody + "Connection: close\r\n\r\n{}\n",
              dateless(gate::grantedResponse(answer, {false, false, true})));
}

TEST(Response, TellsAStatusAndNoMore)
{
    const struct {
        int nStatus;
        const char* szBegin;
        const char* szHeaders;
        const char* szBody;
    } RESPONSES[] = {
        {400, "400 Bad Request", "", "malformed\n"},
        {401, "401 Unauthorized", "WWW-Authenticate: Bearer\r\n",
         "a token is needed: Authorization: Bearer ID\n"},
        {403, "403 Forbidden", "", "refused\n"},
        {404, "404 Not Found", "", "there are /health and /metrics\n"},
        {405, "405 Method Not Allowed", "Allow: GET, HEAD\r\n", "not by this method\n"},
        {414, "414 URI Too Long", "", "too long\n"},
        {431, "431 Request Header Fields Too Large", "", "too large\n"},
        {503, "503 Service Unavailable", "Retry-After: 1\r\n", "not now; nothing was spent\n"},
    };
    for (const auto& row : RESPONSES) {
        const std::string strBody = row.szBody;
        EXPECT_EQ(std::string("HTTP/1.1 ") + row.szBegin + "\r\nD\r\n" + row.szHeaders +
                      "Cache-Control: no-store\r\nContent-Type: text/plain\r\nContent-Length: " +
                      std::to_string(strBody.size()) + "\r\n\r\n" + strBody,
                  dateless(gate::plainResponse(row.nStatus, {true, false, false})));
    }
}

namespace {

Answer answerOf(uint64_t nNumber, Outcome outcome, const std::string& strRecord = "")
{
    Answer answer;
    answer.nNumber = nNumber;
    answer.outcome = outcome;
    answer.strRecord = strRecord;
    return answer;
}

} // namespace

TEST(Repeats, HaveTheAnswerOfTheFirstForFiveSeconds)
{
    for (const Outcome outcome : {Outcome::Granted, Outcome::Refused}) {
        Repeats repeats;
        EXPECT_FALSE(repeats.find("key", 1, 0));
        ASSERT_TRUE(repeats.find("key", 2, 1));
        EXPECT_EQ(1U, repeats.find("key", 2, 1)->nCall);
        EXPECT_FALSE(repeats.find("key", 2, 1)->blAnswered);
        EXPECT_FALSE(repeats.find("other", 2, 1));
        repeats.answer("key", answerOf(1, outcome, "{}"));
        const Repeats::Remembered* pRemembered = repeats.find("key", 3, 5 * gate::SECOND - 1);
        ASSERT_TRUE(pRemembered);
        EXPECT_TRUE(pRemembered->blAnswered);
        EXPECT_EQ(outcome, pRemembered->answer.outcome);
        EXPECT_EQ("{}", pRemembered->answer.strRecord);
        EXPECT_FALSE(repeats.find("key", 3, 5 * gate::SECOND));
    }
}

TEST(Repeats, AreAskedAnewAfterAnAnswerThatSpentNothing)
{
    for (const Outcome outcome : {Outcome::Failed, Outcome::Late, Outcome::Cancelled}) {
        Repeats repeats;
        repeats.find("key", 1, 0);
        repeats.answer("key", answerOf(1, outcome));
        EXPECT_FALSE(repeats.find("key", 2, 0));
    }
    Repeats repeats;
    repeats.find("key", 1, 0);
    repeats.forget("key", 1);
    EXPECT_FALSE(repeats.find("key", 2, 0));
    EXPECT_TRUE(repeats.find("key", 3, 5 * gate::SECOND - 1)) << "the time of the first is over, not its own";
}

TEST(Repeats, TakeNothingFromACallThatCameLaterWithTheSameKey)
{
    Repeats repeats;
    repeats.find("key", 1, 0);
    repeats.find("key", 2, 5 * gate::SECOND);
    repeats.answer("key", answerOf(1, Outcome::Granted));
    repeats.answer("key", answerOf(1, Outcome::Late));
    repeats.forget("key", 1);
    ASSERT_TRUE(repeats.find("key", 3, 5 * gate::SECOND));
    EXPECT_EQ(2U, repeats.find("key", 3, 5 * gate::SECOND)->nCall);
    EXPECT_FALSE(repeats.find("key", 3, 5 * gate::SECOND)->blAnswered);
}

TEST(Repeats, HoldABoundedAmountOfMemory)
{
    Repeats repeats;
    const std::string strRecord(gate::RECORD_MAX, 'r');
    const uint64_t nNumber = (64 << 20) / strRecord.size(); // twice as much as there is room for
    for (uint64_t nCall = 1; nCall <= nNumber; ++nCall) {
        repeats.find(std::to_string(nCall), nCall, 0);
        repeats.answer(std::to_string(nCall), answerOf(nCall, Outcome::Granted, strRecord));
    }
    uint64_t nHeld = 0;
    for (uint64_t nCall = nNumber; nCall > 0 && repeats.find(std::to_string(nCall), nCall, 0); --nCall) {
        ++nHeld;
    }
    EXPECT_LT(nNumber / 3, nHeld);
    EXPECT_GT(nNumber / 2, nHeld);
}
