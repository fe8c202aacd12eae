#include "Servers.h"

#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>
#include <fstream>
#include <stdexcept>

#include "../peers/Redis.h"
#include "Load.h"
#include "Processes.h"

namespace {

// KEYS: the id. ARGV: API and method. It reads and returns no more than the gate's answer needs.
const char* const GRANT = R"lua(
local record = redis.call('HMGET', KEYS[1], 'count', 'webapi_allow', 'uid', 'function')
if not record[1] then
    return false
end
local api = cjson.decode(record[2])[ARGV[1]]
for _, listed in ipairs(api and api.method or {}) do
    if listed == ARGV[2] then
        local count = tonumber(record[1])
        if count > 1 then
            redis.call('HINCRBY', KEYS[1], 'count', -1)
        elseif count >= 0 then
            redis.call('DEL', KEYS[1])
        end
        return {record[3], record[4]}
    end
end
return false
)lua";

const char* const NGINX = R"conf(
daemon off;
master_process off;
worker_processes 1;
pid DIR/nginx.pid;
error_log /dev/null;
events { worker_connections 2048; }
http {
    access_log off;
    client_body_temp_path DIR/body;
    proxy_temp_path DIR/proxy;
    fastcgi_temp_path DIR/fastcgi;
    uwsgi_temp_path DIR/uwsgi;
    scgi_temp_path DIR/scgi;
    keepalive_requests 1000000000;
    upstream gate {
        server unix:GATE;
        keepalive 512;
        keepalive_requests 1000000000;
    }
    server {
        listen unix:DIR/at-once;
        location / { return 204; }
    }
    server {
        listen unix:DIR/nginx;
        location / {
            auth_request /gate;
            root DIR/pages;
        }
        location = /gate {
            internal;
            proxy_pass http://gate/grant/API/METHOD;
            proxy_pass_request_body off;
            proxy_set_header Content-Length "";
            proxy_http_version 1.1;
            proxy_set_header Connection "";
        }
    }
}
)conf";

bool isListening(const std::string& strPath)
{
    try {
        close(connectTo(strPath));
        return true;
    } catch (const std::runtime_error&) {
        return false;
    }
}

double memoryOf(pid_t pid)
{
    std::ifstream status("/proc/" + std::to_string(pid) + "/status");
    for (std::string strLine; std::getline(status, strLine);) {
        if (0 == strLine.compare(0, 6, "VmRSS:")) {
            return 1024 * strtod(&strLine[6], nullptr);
        }
    }
    return 0;
}

void replaceAll(std::string& strText, const std::string& strWhat, const std::string& strWith)
{
    for (size_t n = strText.find(strWhat); std::string::npos != n;
         n = strText.find(strWhat, n + strWith.size())) {
        strText.replace(n, strWhat.size(), strWith);
    }
}

std::string nginxConfiguration(const std::string& strDirectory, std::string strGate)
{
    const std::string strFile = strDirectory + "/nginx.conf";
    std::string strText = NGINX;
    strGate = strGate.empty() ? strDirectory + "/at-once" : strGate;
    for (const auto& [szWhat, strWith] : {std::pair<const char*, std::string>("DIR", strDirectory),
                                          {"GATE", strGate},
                                          {"API", webapi()},
                                          {"METHOD", method()}}) {
        replaceAll(strText, szWhat, strWith);
    }
    mkdir((strDirectory + "/pages").c_str(), 0755);
    std::ofstream(strDirectory + "/pages/page") << "a page\n";
    std::ofstream(strFile) << strText;
    return strFile;
}

} // namespace

Program::Program(const std::vector<std::string>& strArguments, const std::string& strPath)
    : m_pid(startProcess([&] {
          std::vector<char*> szArguments;
          for (const std::string& strArgument : strArguments) {
              szArguments.push_back(const_cast<char*>(strArgument.c_str()));
          }
          szArguments.push_back(nullptr);
          execvp(szArguments[0], szArguments.data());
      }))
{
    for (int i = 0; i < 500; ++i, usleep(10000)) {
        if (isListening(strPath)) {
            return;
        }
    }
    throw std::runtime_error(strArguments[0] + " does not listen at " + strPath);
}

Program::~Program()
{
    kill(m_pid, SIGTERM);
    endsWell(m_pid);
}

double Program::memory() const
{
    double dAll = memoryOf(m_pid);
    std::ifstream children("/proc/" + std::to_string(m_pid) + "/task/" + std::to_string(m_pid) + "/children");
    for (pid_t pid = 0; children >> pid;) {
        dAll += memoryOf(pid);
    }
    return dAll;
}

Gate::Gate(const Store& store)
    : m_strPath(store.directory() + "/calls"),
      m_program({VEMO_BENCH_GATE, "--socket", m_strPath, "--user", "nobody"}, m_strPath)
{
}

Nginx::Nginx(const Store& store, const std::string& strGate)
    : m_strPath(store.directory() + "/nginx"),
      m_program({"nginx", "-c", nginxConfiguration(store.directory(), strGate)}, m_strPath)
{
}

std::string fillRedis(const std::string& strPath, int nTokens)
{
    const redis::Context pContext = redis::connect(strPath);
    const auto run = [&pContext](const std::vector<const char*>& szWords) {
        return redis::run(*pContext, szWords);
    };
    run({"FLUSHALL"});
    run({"MULTI"});
    for (int i = 0; i < nTokens; ++i) {
        const BareToken token = tokenOf(i);
        run({"HSET", token.strTid.c_str(), "count", std::to_string(token.nCount).c_str(), "webapi_allow",
             token.strWebapiAllow.c_str(), "uid", std::to_string(token.nUid).c_str(), "function",
             token.strFunction.c_str()});
    }
    run({"EXEC"});
    return run({"SCRIPT", "LOAD", GRANT})->str;
}
