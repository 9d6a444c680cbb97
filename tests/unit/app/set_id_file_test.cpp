#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <iterator>
#include <string>

#include "app/SetIDFile.h"
#include "platform/base/Log.h"
#include "tests/unit/support/TemporaryDirectory.h"
#include "tests/unit/support/Transcript.h"

namespace {

// "refused", "none" for a file without an ID, or the ID.
std::string read(const std::string& path) {
    CFStringRef id = nullptr;
    if (!CopySetIDFromFile(path.c_str(), &id)) {
        return "refused";
    }
    if (id == nullptr) {
        return "none";
    }
    const std::string text = CFStringGetCStringPtr(id, kCFStringEncodingUTF8);
    CFRelease(id);
    return testing_support::escaped(text);
}

// A command line that makes "id", the text that is written then, and "full" for a disk with room for one
// byte.
TEST(SetIDFile, IsWhatItsTableSays) {
    testing_support::Transcript transcript("set_id_file");
    const auto handler = std::signal(SIGXFSZ, SIG_IGN);
    rlimit whole{};
    getrlimit(RLIMIT_FSIZE, &whole);
    transcript.replay("read, written, read again", [&](const testing_support::Transcript::Inputs& inputs) {
        const testing_support::TemporaryDirectory directory;
        const std::string path = directory.at("id");
        directory.write("victim", "untouched");
        EXPECT_EQ(std::system(("cd " + directory.path().string() + " && " + inputs[0]).c_str()), 0);
        std::string log;
        const platform::LogCapture capture(
            [&log](platform::LogLevel, std::string_view line) { log += line.substr(line.rfind(':')); });
        const std::string before = read(path);
        const rlimit bound{inputs.size() > 2 ? 1 : whole.rlim_cur, whole.rlim_max};
        setrlimit(RLIMIT_FSIZE, &bound);
        const mode_t mask = umask(0);
        WriteSetIDFile(path.c_str(), inputs[1].c_str());
        umask(mask);
        setrlimit(RLIMIT_FSIZE, &whole);
        struct stat status {};
        EXPECT_EQ(stat(path.c_str(), &status), 0);
        EXPECT_EQ(read(directory.at("victim")), "untouched");
        const auto names = std::distance(std::filesystem::directory_iterator(directory.path()), {});
        return before + ", " + read(path) + (status.st_mode % 01000 == 0600 ? ", private" : "") + log +
               (names == 2 ? "" : ", " + std::to_string(names) + " names in the folder");
    });
    std::signal(SIGXFSZ, handler);
}

}  // namespace
