// What a command of the tool finds and what it leaves: the store, and files beside it. Judges a run in which
// something failed.

#ifndef TESTS_TOOL_SCENE_H
#define TESTS_TOOL_SCENE_H

#include <string>
#include <vector>

#include "TokenStore.h"
#include "ToolRun.h"

class Scene {
public:
    // Runs the command once undisturbed, to know what it gives. "IN" among the arguments is a file of two
    // tokens, "OUT" one that holds something else yet.
    Scene(const std::vector<std::string>& strArguments, bool blStore);
    ~Scene();
    Scene(const Scene&) = delete;
    Scene& operator=(const Scene&) = delete;

    // The directories of the store and of the files beside it.
    const std::string& storeDirectory() const { return m_store.directory(); }
    const std::string& files() const { return m_strFiles; }

    const Ending& undisturbed() const { return m_undisturbed; }

    // How many calls a fault of this kind can happen to.
    int64_t calls(Fault::Kind kind) const;

    // Runs the command and returns what is wrong with how it ended, "" when nothing is:
    // - the store is sound and as before the command, after its purge or after all of it; the file OUT is the
    //   old one or the whole new one, and there is no other
    // - it succeeds, and all is done and said as undisturbed; or it fails with one sentence, which names the
    //   cause, and says so when the change was made all the same
    // - it ends by itself, unless the fault is a signal
    std::string judge(const Fault& fault) const;

private:
    void prepare() const;
    std::string leftFiles(const Fault& fault) const;
    std::string wrongWithFailure(const Ending& ending, const Fault& fault, const std::string& strState) const;
    bool isUndisturbed(const Ending& ending) const;

    TokenStore m_store;
    const std::string m_strFiles; // directory
    std::vector<std::string> m_strArguments;
    const bool m_blStore;
    std::string m_strBefore;
    std::string m_strPurged;
    std::string m_strAfter;
    std::string m_strNewFile;
    Ending m_undisturbed;
};

#endif
