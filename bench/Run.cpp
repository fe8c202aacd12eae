#include "Run.h"

#include <json/version.h>
#include <sqlite3.h>

#include <cstdio>
#include <fstream>
#include <stdexcept>

double procValue(const std::string& strFile, const std::string& strName)
{
    std::ifstream file("/proc/" + strFile);
    std::string strLine;
    while (std::getline(file, strLine)) {
        if (0 == strLine.compare(0, strName.size(), strName)) {
            return std::stod(strLine.substr(strName.size()));
        }
    }
    throw std::runtime_error(strFile + " has no " + strName);
}

int main(int argc, char** argv)
{
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv)) {
        return 2;
    }
    benchmark::AddCustomContext("library", VEMO_ATOKEN_VERSION);
    benchmark::AddCustomContext("compiler", VEMO_ATOKEN_COMPILER);
    benchmark::AddCustomContext("sqlite", sqlite3_libversion());
    benchmark::AddCustomContext("jsoncpp", JSONCPP_VERSION_STRING);
    try {
        registerBenchmarks();
        benchmark::RunSpecifiedBenchmarks();
        return 0;
    } catch (const std::exception& exception) {
        fprintf(stderr, "%s: %s\n", argv[0], exception.what());
        return 1;
    }
}
