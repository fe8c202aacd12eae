#include "Scene.h"

#include <sha2.h>
#include <signal.h>

#include <algorithm>
#include <cctype>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <sstream>

#include "Operations.h"
#include "vemo-access-token.h"

namespace {

namespace fs = std::filesystem;

const char* const OLD_FILE = "what was there\n";
const char* const PREFIX = "vemo-access-token: ";

// The sentences that name the cause. SQLite does not tell of a journal that it cannot make why, works on
// where it may only read, and takes an error of reading for damage.
std::vector<std::string> causes(Fault::Kind kind)
{
    switch (kind) {
    case Fault::Kind::Error:
        return {"Input/output error",
                "disk I/O error",
                "unable to open database file",
                "attempt to write a readonly database",
                "database disk image is malformed",
                "the kernel gives no random numbers"};
    case Fault::Kind::FullDisk:
        return {"No space left on device", "database or disk is full", "disk I/O error",
                "unable to open database file", "attempt to write a readonly database"};
    case Fault::Kind::Memory:
    case Fault::Kind::Parsing: return {"out of memory", "Cannot allocate memory"};
    case Fault::Kind::Signal: break;
    }
    return {};
}

bool contains(const std::string& strText, const std::string& strPart)
{
    return std::string::npos != strText.find(strPart);
}

std::string contentsOf(const fs::path& path)
{
    std::ostringstream contents;
    contents << std::ifstream(path, std::ios::binary).rdbuf();
    return contents.str();
}

std::string line(const std::string& strName)
{
    return R"({"bind_sid":"","count":2,"create_time":1,"deadline":4102444800,"extra":{"n":[1.5,"x"]},)"
           R"("function":"VPN","tid":")" +
           idOf(strName) + R"(","uid":0,"webapi_allow":{"Example.Api":{"method":["get"]}}})" + "\n";
}

// An export of two tokens.
std::string exported()
{
    const std::string strLines = line("four") + line("five");
    char szDigest[SHA256_DIGEST_STRING_LENGTH];
    SHA256Data(reinterpret_cast<const uint8_t*>(strLines.data()), strLines.size(), szDigest);
    return strLines + R"({"end":{"sha256":")" + szDigest + R"(","tokens":2}})" + "\n";
}

// What the tool said, without what differs from run to run: fresh ids, times, and the name of a user, which
// it leaves out where it cannot look it up.
std::string withoutChance(const std::string& strText)
{
    std::string strOut;
    for (size_t i = 0; i < strText.size();) {
        size_t nEnd = i;
        while (nEnd < strText.size() && isalnum(static_cast<unsigned char>(strText[nEnd]))) {
            ++nEnd;
        }
        const std::string strWord = strText.substr(i, nEnd - i);
        if (strWord.empty()) {
            const char c = strText[nEnd++];
            strOut += c == ' ' || c == '(' || c == ')' ? "" : std::string(1, c);
        } else if (strWord.size() >= VEMO_ATOKEN_LENGTH_MIN && 0 != strWord.compare(0, 5, "known")) {
            strOut += "ID";
        } else if (strWord != "root") {
            std::copy_if(strWord.begin(), strWord.end(), std::back_inserter(strOut),
                         [](unsigned char c) { return !isdigit(c); });
        }
        i = nEnd;
    }
    return strOut;
}

// The lines of what a run said on standard error, but for those that an undisturbed one says.
std::vector<std::string> sentences(const std::string& strError, const std::string& strUndisturbed)
{
    std::vector<std::string> strLines;
    std::istringstream stream(strError);
    for (std::string strLine; std::getline(stream, strLine);) {
        if (!contains(strUndisturbed, strLine + "\n")) {
            strLines.push_back(strLine);
        }
    }
    return strLines;
}

} // namespace

Scene::Scene(const std::vector<std::string>& strArguments, bool blStore)
    : m_strFiles(m_store.directory() + ".files"), m_strArguments(strArguments), m_blStore(blStore)
{
    for (std::string& strArgument : m_strArguments) {
        strArgument =
            strArgument == "IN" || strArgument == "OUT" ? m_strFiles + "/" + strArgument : strArgument;
    }
    prepare();
    m_strBefore = m_store.state();
    runTool({"purge"}, {});
    m_strPurged = m_store.state();
    prepare();
    m_undisturbed = runTool(m_strArguments, {});
    m_strAfter = m_store.state();
    m_strNewFile = contentsOf(m_strFiles + "/OUT");
}

Scene::~Scene()
{
    std::error_code ignored;
    fs::remove_all(m_strFiles, ignored);
}

void Scene::prepare() const
{
    fs::remove_all(m_strFiles);
    fs::create_directory(m_strFiles);
    std::ofstream(m_strFiles + "/IN") << exported();
    std::ofstream(m_strFiles + "/OUT") << OLD_FILE;
    fs::create_directory(m_store.directory());
    prepareStore(m_store, m_blStore ? operations().back() : operations().front());
    if (!m_blStore) {
        fs::remove(m_store.directory());
    }
}

int64_t Scene::calls(Fault::Kind kind) const
{
    prepare();
    Fault fault;
    fault.kind = kind;
    return runTool(m_strArguments, fault).nCalls;
}

bool Scene::isUndisturbed(const Ending& ending) const
{
    return ending.nStatus == m_undisturbed.nStatus &&
           withoutChance(ending.strOutput) == withoutChance(m_undisturbed.strOutput) &&
           ending.strError == m_undisturbed.strError;
}

// What is wrong with the files beside the store.
std::string Scene::leftFiles(const Fault& fault) const
{
    const std::string strFile = contentsOf(m_strFiles + "/OUT");
    std::string strWrong = strFile == OLD_FILE || strFile == m_strNewFile ? "" : "half a file; ";
    for (const auto& entry : fs::directory_iterator(m_strFiles)) {
        const std::string strName = entry.path().filename();
        // It is there to stay when the process cannot remove it.
        const bool blExcused = (SIGKILL == fault.nSignal || Fault::Kind::Error == fault.kind) &&
                               0 == strName.compare(0, 4, "OUT.") &&
                               (entry.status().permissions() & fs::perms::all) == fs::perms(0600);
        if (strName != "IN" && strName != "OUT" && !blExcused) {
            strWrong += "left " + strName + "; ";
        }
    }
    return strWrong;
}

std::string Scene::wrongWithFailure(const Ending& ending, const Fault& fault,
                                    const std::string& strState) const
{
    const bool blDoctor = m_strArguments[0] == "doctor"; // whose findings are sentences too
    std::string strWrong;
    const std::vector<std::string> strSentences = sentences(ending.strError, m_undisturbed.strError);
    if (!blDoctor && (1 != strSentences.size() || 0 != strSentences[0].compare(0, strlen(PREFIX), PREFIX))) {
        strWrong += "not one sentence; ";
    }
    const bool blInput = contains(ending.strError, m_strFiles + "/IN: ");
    const int nStatus = blInput ? 2 : 4;
    // What doctor cannot look at is a finding, if it can print that.
    const bool blMute = fault.isOfMemory() || contains(ending.strError, "cannot write the result");
    const bool blDoctorsStatus = 5 == ending.nStatus || (0 == ending.nStatus && strState == m_strAfter) ||
                                 (4 == ending.nStatus && blMute);
    if (blDoctor ? !blDoctorsStatus : ending.nStatus != nStatus) {
        strWrong += "status " + std::to_string(ending.nStatus) + "; ";
    }
    const std::vector<std::string> strCauses = causes(fault.kind);
    if (!blDoctor && std::none_of(strCauses.begin(), strCauses.end(), [&](const std::string& strCause) {
            return contains(ending.strError, strCause);
        })) {
        strWrong += "no cause is named; ";
    }
    const bool blSaysChange = contains(ending.strError, "the change was made");
    const bool blSaysPerhaps = contains(ending.strError, "the change may have been made");
    if (!m_blStore || blDoctor) {
        return strWrong; // what these have made stays, and is seen by calling them again
    }
    if (strState != m_strBefore && strState == m_strAfter && !blSaysChange && !blSaysPerhaps) {
        strWrong += "the change was made, which it does not say; ";
    }
    if (strState != m_strAfter && blSaysChange) {
        strWrong += "the change was not made, but it says so; ";
    }
    return strWrong;
}

std::string Scene::judge(const Fault& fault) const
{
    prepare();
    const Ending ending = runTool(m_strArguments, fault);
    std::string strWrong = leftFiles(fault);
    const std::string strState = fs::exists(m_store.directory()) ? m_store.state() : STATE_MISSING;
    const bool blHalfMade = !m_blStore && (strState == STATE_NO_TABLE || strState.empty());
    if (strState != m_strBefore && strState != m_strPurged && strState != m_strAfter && !blHalfMade) {
        strWrong += "a third state: " + strState.substr(0, 200) + "; ";
    }
    const bool blTellsId = m_strArguments[0] == "create" || m_strArguments[0] == "rotate";
    if (blTellsId && SIGKILL != fault.nSignal && strState == m_strAfter && ending.strOutput.empty() &&
        !contains(ending.strError, "cannot be taken back")) {
        strWrong += "a token whose id nobody knows; ";
    }
    if (ending.nSignal != (Fault::Kind::Signal == fault.kind ? fault.nSignal : 0)) {
        strWrong += "ended by signal " + std::to_string(ending.nSignal) + "; ";
    } else if (0 == ending.nSignal && !isUndisturbed(ending)) {
        strWrong += wrongWithFailure(ending, fault, strState);
    } else if (0 == ending.nSignal &&
               (strState != m_strAfter || contentsOf(m_strFiles + "/OUT") != m_strNewFile)) {
        strWrong += "reported success, yet it is not done; ";
    }
    return strWrong.empty()
               ? ""
               : strWrong + "said: " + ending.strError + "; printed: " + ending.strOutput.substr(0, 500);
}
