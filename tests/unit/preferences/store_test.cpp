#include <sys/stat.h>

#include <chrono>
#include <filesystem>
#include <map>
#include <sstream>

#include "platform/preferences/Session.h"
#include "tests/unit/preferences/Store.h"
#include "tests/unit/support/PrivateNetwork.h"
#include "tests/unit/support/Transcript.h"

namespace preferences_test {
namespace {

using platform::preferences::Session;

// Plays a step of the transcript, in which "a" is a session:
//
//     store                        a good store instead of all that there was, and no sessions
//     sh COMMAND                   in the directory that holds the store's
//     status NUMBER                what it means
//     a open                       a close
//     a lock, a lock wait          a unlock           a commit, a commit soon: waiting for no lock
//     a get PATH                   a link PATH        a remove PATH      a value KEY
//     a set PATH VALUE             a setvalue KEY VALUE                  a setdeep PATH LEVELS
//     a hold PATH                  retains what is there; "held" shows what was held, as it is now
//     a same b PATH                whether two sessions share what is there
class Player : public StoreTest {
  protected:
    std::string play(const std::string& step) {
        log.clear();
        std::istringstream words(step);
        std::string name, verb, path;
        words >> name >> verb >> path >> std::ws;
        std::string rest;
        std::getline(words, rest, '\0');
        if (name == "store") {
            sessions.clear();
            held.clear();
            std::filesystem::remove_all(directory.path());
            makeStore();
            EXPECT_EQ(chmod(directory.at("store").c_str(), 0700), 0);
            return "";
        }
        if (name == "sh") {
            const std::string output =
                testing_support::shell("cd " + directory.path().string() + "\n" + step.substr(3));
            return output.empty() ? "" : "    " + output.substr(0, output.size() - 1);
        }
        if (name == "status") {
            return std::string("    ") + SCErrorString(std::stoi(verb));
        }
        if (name == "held") {
            std::string all;
            for (const auto& value : held) {
                all += (all.empty() ? "    " : "\n    ") + show(value.get());
            }
            return all;
        }
        const std::string outcome = playOn(sessions[name], verb, path, rest);
        return "    " + (outcome.empty() ? "" : outcome + ", ") + std::to_string(SCError()) + log;
    }

  private:
    std::string playOn(SessionRef& session, const std::string& verb, const std::string& path,
                       const std::string& value) {
        SCPreferencesRef const ref = session.get();
        const auto key = path == "nokey" ? Owned<CFStringRef>() : text(path == "empty" ? "" : path);
        Boolean done = 2;
        if (verb == "open") {
            session = open();
            done = session.get() != nullptr;
        } else if (verb == "close") {
            session = {};
        } else if (verb == "lock") {
            done = SCPreferencesLock(ref, path == "wait");
        } else if (verb == "unlock") {
            done = SCPreferencesUnlock(ref);
        } else if (verb == "commit" && path == "soon") {
            return "status " +
                   std::to_string(Session::from(ref)->commit(std::chrono::milliseconds(20)).status());
        } else if (verb == "commit") {
            done = SCPreferencesCommitChanges(ref);
        } else if (verb == "remove") {
            done = SCPreferencesPathRemoveValue(ref, key.get());
        } else if (verb == "set") {
            const auto dictionary = read(value);
            done = SCPreferencesPathSetValue(ref, key.get(), as<CFDictionaryRef>(dictionary.get()));
            changeLater(dictionary.get());
        } else if (verb == "setvalue") {
            const auto any =
                value == "url"
                    ? Owned<CFTypeRef>::adopt(CFURLCreateWithString(nullptr, CFSTR("http://a/"), nullptr))
                : value == "null" ? Owned<CFTypeRef>()
                                  : read(value);
            done = SCPreferencesSetValue(ref, key.get(), any.get());
        } else if (verb == "setdeep") {
            std::string deep = "{}";
            for (int levels = std::stoi(value); levels > 1; --levels) {
                deep = "{a = " + deep + "}";
            }
            done = static_cast<Boolean>(set(session, path, deep));
        } else if (verb == "hold") {
            held.push_back(Owned<CFTypeRef>::retained(SCPreferencesPathGetValue(ref, key.get())));
        } else if (verb == "same") {
            const auto where = text(value);
            const bool isSame = SCPreferencesPathGetValue(ref, where.get()) ==
                                SCPreferencesPathGetValue(sessions[path].get(), where.get());
            return isSame ? "the same" : "another";
        } else if (verb == "value") {
            return show(SCPreferencesGetValue(ref, key.get()));
        } else if (verb == "get" || verb == "link") {
            return show(verb == "get" ? static_cast<CFTypeRef>(SCPreferencesPathGetValue(ref, key.get()))
                                      : SCPreferencesPathGetLink(ref, key.get()));
        } else {
            ADD_FAILURE() << "no such step: " << verb;
        }
        EXPECT_TRUE(done == 2 || (done == 1) == (SCError() == 0)) << verb;
        return "";
    }

    // What the caller does to a value that was stored: it is stored as it was.
    static void changeLater(CFTypeRef value) {
        const auto dictionary = as<CFDictionaryRef>(value);
        if (dictionary != nullptr) {
            for (const auto& [key, inner] : platform::values::entriesOf(dictionary)) {
                changeLater(inner);
            }
            CFDictionarySetValue(const_cast<CFMutableDictionaryRef>(dictionary), CFSTR("later"), CFSTR("x"));
        }
    }

    std::map<std::string, SessionRef> sessions;
    std::vector<Owned<CFTypeRef>> held;
};

TEST_F(Player, Store) {
    const mode_t before = umask(0);
    testing_support::Transcript transcript("store");
    transcript.playItself([this](const std::string& step) { return play(step); });
    umask(before);
}

}  // namespace
}  // namespace preferences_test
