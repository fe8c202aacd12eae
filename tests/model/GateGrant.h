// A grant as the gate makes it, in the place of the library's.

#ifndef TESTS_MODEL_GATE_GRANT_H
#define TESTS_MODEL_GATE_GRANT_H

#include <json/value.h>

#include <string>

// Does what VemoAccessTokenGrantEx does. What the gate refuses on purpose though the library grants it, the
// library grants here.
int grantAtTheGate(std::string& strTid, const char* szWebapiName, const char* szWebapiMethod,
                   Json::Value& jToken);

#endif
