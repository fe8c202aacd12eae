// Stand-ins for functions of the library whose failure nothing but a stand-in can bring about. They
// are found ahead of the library's own, to which they go on unless a test has set them.

#ifndef TESTS_STAND_INS_H
#define TESTS_STAND_INS_H

#include <dlfcn.h>
#include <json/json.h>

#include <functional>
#include <string>
#include <vector>

struct StandIns {
    std::function<int(Json::Value&, bool)> fillDefaultValue;
    std::function<int(int, long&)> getTimeAfterNow; // the one that yields a number
    std::function<int(std::string&)> sqlExpandMemberName;
    std::function<int(std::string&)> sqlExpandMemberSymbol;
    std::function<int(std::string&)> sqlExpandCreateTable;
    std::function<int(const char*, std::string&, Json::Value&)> tokenGetOne;
    std::function<int(std::vector<std::string>&, const char*, Json::Value&)> vectorParamToJson;
    std::function<int(std::string&, const char*, const char*, Json::Value&)> grantEx;
};

StandIns& standIns();

// The definition of a function that would be found if ours were not here, by its mangled name.
template <typename Function>
Function* next(const char* szMangledName)
{
    return reinterpret_cast<Function*>(dlsym(RTLD_NEXT, szMangledName));
}

#endif
