// The front end: one command word a run.
//
// A known word gives exit status 0 whatever failed inside it, as the applications that run this tool expect;
// what happened is in the trace.
#include <fcntl.h>
#include <strings.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <string>
#include <utility>

#include "app/ArvAssistant.h"
#include "app/Turn.h"
#include "platform/SystemConfiguration.h"

ArvAssistant assistant;

namespace {

constexpr int kFewestArguments = 2;
constexpr int kMostArguments = 5;
constexpr int kPasswordIndex = 4;

bool IsWord(const char* word, const char* wanted) {
    return std::strcmp(word, wanted) == 0;
}

void ShowUsage(const char* programName) {
    std::printf("Usage: %s (create | remove)\n", programName);
    std::printf("\t %s create : Remembers the current location, creates a new temporary one.\n", programName);
    std::printf(
        "\t %s create auto : Remembers the current location, creates a new temporary auto IP location.\n",
        programName);
    std::printf("\t %s remove : Removes the new temporary location and restores the original one.\n",
                programName);
    std::printf("\n");
}

// Has what is committed applied, as far as an earlier run left that undone: it was ended half-way, or a
// daemon was away. So every command, again, finishes what went wrong before. What comes of it is in the
// system log.
void FinishEarlierRun() {
    SCPreferencesRef session = SCPreferencesCreate(kCFAllocatorDefault, CFSTR("location-assistant"), nullptr);
    if (session != nullptr) {
        SCPreferencesApplyChanges(session);
        CFRelease(session);
    }
}

// The last clean-up runs when the new location is current: it removes every other one of the temporary name,
// and the library refuses to delete the current one.
OSStatus CreateTemporary(char* mode, char* networkName, char* password) {
    assistant.Initialize();
    assistant.CleanupOldTemporarySets();
    assistant.SaveOriginalSet();
    assistant.CleanupOldTemporarySets();
    OSStatus err = assistant.CreateTemporarySet(mode, networkName, password);
    if (err == 0) {
        err = assistant.ActivateTemporarySet();
    }
    assistant.CleanupOldTemporarySets();
    assistant.CleanUp();
    return err;
}

OSStatus RemoveTemporary() {
    assistant.Initialize();
    assistant.RestoreOriginalSet();
    assistant.CleanupOldTemporarySets();
    assistant.CleanUp();
    return 0;
}

OSStatus RemoveTemporary2() {
    assistant.Initialize();
    assistant.RestoreOriginalSet2();
    assistant.CleanupOldTemporarySets();
    assistant.CleanupOldUserSets();
    assistant.SaveOriginalSet();
    assistant.CleanUp();
    return 0;
}

OSStatus SaveTemporary() {
    assistant.CleanupOldUserSets();
    assistant.SaveTemporarySet();
    assistant.CleanupOldUserSets();
    return 0;
}

OSStatus SaveZAT() {
    assistant.SaveZATSet();
    return 0;
}

// A mode that is none counts as no word at all, and so do those behind it.
OSStatus CreateTemporaryOfWords(char* mode, char* networkName, char* password) {
    const bool isMode = mode != nullptr &&
                        (IsWord(mode, "auto") || IsWord(mode, "wirelessAuto") || IsWord(mode, "from_intro"));
    return isMode ? CreateTemporary(mode, networkName, password) : CreateTemporary(nullptr, nullptr, nullptr);
}

// 1 when the first word is a known one, else 0. argv holds argc words, the program's name first.
int ProcessArguments(int argc, const char** argv) {
    const auto word = [argc, argv](int index) {
        return index < argc ? const_cast<char*>(argv[index]) : nullptr;
    };
    const std::pair<const char*, std::function<OSStatus()>> commands[] = {
        {"create", [&] { return CreateTemporaryOfWords(word(2), word(3), word(kPasswordIndex)); }},
        {"remove", RemoveTemporary},
        {"save", SaveTemporary},
        {"saveZAT", SaveZAT},
        {"restoreZAT", RemoveTemporary2},
        {"test", [] { return assistant.Run(); }},
    };
    for (const auto& [known, run] : commands) {
        if (IsWord(word(1), known)) {
            const Turn turn;
            FinishEarlierRun();
            static_cast<void>(run());
            return 1;
        }
    }
    return 0;
}

// A descriptor that the caller closed would be given to the next file that is opened, and the trace or a
// message would go into that file. A closed standard output becomes one that nobody reads: the prompt of
// "test" ends with it, as with every other reader that is gone.
void OpenStandardDescriptors() {
    for (int descriptor = STDIN_FILENO; descriptor <= STDERR_FILENO; ++descriptor) {
        if (fcntl(descriptor, F_GETFD) >= 0) {
            continue;
        }
        int ends[2] = {-1, -1};
        if (descriptor != STDOUT_FILENO || pipe(ends) != 0) {
            static_cast<void>(open("/dev/null", O_RDWR | O_NOCTTY));
            continue;
        }
        // The reading end takes the free place, and the writing end takes it over.
        dup2(ends[1], descriptor);
        for (const int end : ends) {
            if (end != descriptor) {
                close(end);
            }
        }
    }
}

}  // namespace

int main(int argc, char** argv) {
    // Libraries below take orders from the environment: where to read a time zone, or to print what they
    // parse, passwords included.
    clearenv();
    OpenStandardDescriptors();
    std::signal(SIGPIPE, SIG_IGN);
    umask(S_IRWXG | S_IRWXO);

    const char* programName = argc > 0 ? argv[0] : "location-assistant";
    if (argc < kFewestArguments || argc > kMostArguments) {
        ShowUsage(programName);
        return 1;
    }

    // Everybody can read the argument list of every process.
    const char* words[kMostArguments] = {};
    std::string password;
    for (int i = 0; i < argc; ++i) {
        words[i] = argv[i];
    }
    if (argc == kMostArguments) {
        password = argv[kPasswordIndex];
        explicit_bzero(argv[kPasswordIndex], std::strlen(argv[kPasswordIndex]));
        words[kPasswordIndex] = password.c_str();
    }

    const int known = ProcessArguments(argc, words);
    explicit_bzero(password.data(), password.size());
    if (known == 0) {
        ShowUsage(programName);
        return 1;
    }
    return 0;
}
