// Messages between the two processes of the gate: each valid message has exactly one form.

#include "gate/Messages.h"

#include "Require.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* pBytes, size_t cbBytes)
{
    const std::string_view strBytes(reinterpret_cast<const char*>(pBytes), cbBytes);
    if (const auto request = gate::decodeRequest(strBytes)) {
        FUZZ_REQUIRE(cbBytes <= gate::REQUEST_MAX && gate::encode(*request) == strBytes);
        FUZZ_REQUIRE((gate::Ask::Grant == request->ask) == !request->strTid.empty());
    }
    if (const auto answer = gate::decodeReply(strBytes)) {
        FUZZ_REQUIRE(cbBytes <= gate::ANSWER_MAX && gate::encode(*answer) == strBytes);
    }
    return 0;
}
