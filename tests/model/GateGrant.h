// A grant by the gate instead of the library.

#ifndef TESTS_MODEL_GATE_GRANT_H
#define TESTS_MODEL_GATE_GRANT_H

#include <json/value.h>

#include <string>

// Does what VemoAccessTokenGrantEx does. Calls that the gate refuses on purpose go to the library.
int grantAtTheGate(std::string& strTid, const char* szWebapiName, const char* szWebapiMethod,
                   Json::Value& jToken);

#endif
