// Calls of the library in a transcript: each on the tree that is set up, with its status, whether it marked
// the session, the outputs that it wrote, and what it changed.
#pragma once

#include "tests/unit/morescf/Fixture.h"
#include "tests/unit/support/Transcript.h"

// NOLINTNEXTLINE(bugprone-macro-parentheses): the text is half of it.
#define CALL(call) run(#call, [&]() -> OSStatus { return call; })

namespace morescf_test {

class CallsTest : public MoreSCFTest {
  protected:
    // For all calls to come.
    void on(const char* name, const char* tree) {
        transcript->add(std::string("\n=== ") + name);
        tree_ = tree;
    }

    template <class Call>
    void run(const char* text, Call call) {
        setTree(tree_);
        OSStatus err = MoreSCOpen(false, false);
        changes_.clear();
        const OSStatus status = call();
        addOutput("string", string);
        addOutput("dict", dict);
        addOutput("mutableDict", mutableDict);
        addOutput("array", array);
        addOutput("second", second);
        addOutput("mutableArray", mutableArray);
        addNumber("flag", flag);
        addNumber("index", index);
        compare(read(tree_).get(), SCPreferencesPathGetValue(MoreSCGetSCPreferencesRef(), CFSTR("/")), "");
        // On disk only what a marked session commits.
        SCPreferencesSetValue(MoreSCGetSCPreferencesRef(), CFSTR("Added"), kCFBooleanTrue);
        MoreSCClose(&err, false);
        const bool isMarked = tree().ends_with("; Added = #true}");
        transcript->add(std::string(text) + ": " + std::to_string(status) + (isMarked ? ", marked" : "") +
                        changes_);
    }

    std::unique_ptr<testing_support::Transcript> transcript;
    Output<CFStringRef> string;
    Output<CFDictionaryRef> dict;
    Output<CFMutableDictionaryRef> mutableDict;
    Output<CFArrayRef> array;
    Output<CFArrayRef> second;
    Output<CFMutableArrayRef> mutableArray;
    Boolean flag = unwritten;
    CFIndex index = unwritten;

  private:
    static constexpr int unwritten = 77;

    template <class Ref>
    void addOutput(const char* name, Output<Ref>& output) {
        if (output.shown() != "untouched") {
            changes_ += std::string("\n    ") + name + " = " + output.shown();
        }
        output.reset();
    }
    template <class Number>
    void addNumber(const char* name, Number& number) {
        if (number != unwritten) {
            changes_ += std::string("\n    ") + name + " = " + std::to_string(number);
        }
        number = unwritten;
    }
    void compare(CFTypeRef before, CFTypeRef after, const std::string& path) {
        const auto was = platform::values::as<CFDictionaryRef>(before);
        const auto is = platform::values::as<CFDictionaryRef>(after);
        if (was == nullptr || is == nullptr) {
            changes_ +=
                CFEqual(before, after) ? "" : "\n    " + path + ": " + show(before) + " -> " + show(after);
            return;
        }
        for (const auto& [key, value] : platform::values::entriesOf(was)) {
            CFTypeRef now = CFDictionaryGetValue(is, key);
            if (now == nullptr) {
                changes_ += "\n    - " + path + "/" + show(key);
            } else {
                compare(value, now, path + "/" + show(key));
            }
        }
        for (const auto& [key, value] : platform::values::entriesOf(is)) {
            if (!CFDictionaryContainsKey(was, key)) {
                add(path + "/" + show(key), value);
            }
        }
    }
    // A dictionary that holds others entry by entry.
    void add(const std::string& path, CFTypeRef value) {
        const std::string shown = show(value);
        if (shown.find('{', 1) == std::string::npos) {
            changes_ += "\n    + " + path + " = " + shown;
            return;
        }
        for (const auto& [key, item] : platform::values::entriesOf(static_cast<CFDictionaryRef>(value))) {
            add(path + "/" + show(key), item);
        }
    }

    const char* tree_ = "{}";
    std::string changes_;
};

}  // namespace morescf_test
