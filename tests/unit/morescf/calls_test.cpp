// The library's operations, as tests/unit/golden plays them: each on the tree that is set up, with its
// status, whether it marked the session, its outputs ("&"), and what it changed.
#include <cstring>
#include <functional>
#include <map>
#include <optional>
#include <tuple>

#include "morescf/MoreSCFCCLScanner.h"
#include "morescf/MoreSCFHelpers.h"
#include "morescf/MoreSCFPortScanner.h"
#include "morescf/MoreSCFTree.h"
#include "tests/unit/morescf/Fixture.h"
#include "tests/unit/support/Transcript.h"

#define OPERATION(name) named(#name, name)

namespace morescf_test {
namespace {

// The digests that an operation may be given: "some" and "zeros".
const CFStringRef domain = CFSTR("example.org");
using Digests = std::tuple<MoreSCModemDigest, MoreSCPPPDigest, MoreSCIPv4Digest, MoreSCDNSDigest>;
const Digests some = {{CFSTR("script"), 0, 0, 1, 0},
                      {1, nullptr, CFSTR("guest"), nullptr, CFSTR("555"), nullptr, nullptr},
                      {CFSTR("Manual"), {}, {}, {}, nullptr},
                      {0, nullptr, 1, &domain}};
const Digests zeros = {};

// An argument as its text names it: "null", "&" for an output, a number, a digest, a string, or a tree.
template <class T>
class Argument {
    using Target = std::remove_const_t<std::remove_pointer_t<T>>;
    static constexpr bool isDigest = std::is_class_v<Target> && requires { sizeof(Target); };
    static constexpr bool isNumber = std::is_arithmetic_v<Target>;
    static constexpr bool isOutput = std::is_pointer_v<T> && (std::is_pointer_v<Target> || isNumber);

  public:
    explicit Argument(const std::string& text) : text_(text) {}

    T get() {
        if constexpr (std::is_arithmetic_v<T>) {
            return static_cast<T>(std::stoi(text_));
        } else if (text_ == "null") {
            return nullptr;
        } else if constexpr (isOutput) {
            EXPECT_EQ("&", text_);
            return &output_;
        } else if constexpr (isDigest) {
            return &std::get<Target>(text_ == "some" ? some : zeros);
        } else {
            constexpr bool isString = std::is_same_v<T, CFStringRef>;
            value_ = isString ? Value::adopt(platform::values::makeString(text_).take()) : read(text_);
            return static_cast<T>(value_.get());
        }
    }
    [[nodiscard]] std::string output() const {
        if constexpr (isOutput) {
            return text_ == "&" ? "\n    & " + shown(output_) : "";
        }
        return "";
    }

  private:
    struct Number {
        Target value = unwritten;
        Target* operator&() { return &value; }
    };
    struct NoOutput {};
    static constexpr int unwritten = 77;

    static std::string shown(const Number& number) {
        return number.value == unwritten ? "untouched" : std::to_string(number.value);
    }
    static std::string shown(const Output<Target>& reference) { return reference.shown(); }

    std::string text_;
    Value value_;
    std::conditional_t<!isOutput, NoOutput, std::conditional_t<isNumber, Number, Output<Target>>> output_;
};

// Calls the operation with the arguments of these texts; adds its outputs.
using Call = std::function<OSStatus(const std::vector<std::string>&, std::string&)>;
template <class... Types, std::size_t... index>
Call callOf(OSStatus (*operation)(Types...), std::index_sequence<index...> /*all*/) {
    return [operation](const std::vector<std::string>& texts, std::string& outputs) {
        EXPECT_EQ(sizeof...(Types), texts.size());
        std::tuple<Argument<Types>...> arguments{texts.at(index)...};
        const OSStatus err = operation(std::get<index>(arguments).get()...);
        ((outputs += std::get<index>(arguments).output()), ...);
        return err;
    };
}
template <class... Types>
std::pair<std::string, Call> named(const char* name, OSStatus (*operation)(Types...)) {
    return {name, callOf(operation, std::index_sequence_for<Types...>())};
}
template <class... Named>
std::map<std::string, Call> tableOf(Named... entries) {
    return {entries...};
}

// The address as it is read, and written again.
OSStatus MacAddress(CFStringRef text, CFStringRef* again) {
    UInt8 bytes[6] = {1, 2, 3, 4, 5, 6};
    const OSStatus err = MoreSCFStringToMacAddress(text, bytes);
    EXPECT_EQ(0, MoreSCFCreateStringWithMacAddress(bytes, again));
    return err;
}

// "Sets" is as good a parent as any.
OSStatus NewSet(CFStringRef* id, CFStringRef* path) {
    *id = *path = nullptr;
    return MakeNewSeAndCopyIDAndPath(CFSTR("Sets"), id, path);
}

// Whether that changes anything is not asked.
OSStatus SwitchOff(CFDictionaryRef dict, CFMutableDictionaryRef* off) {
    *off = CFDictionaryCreateMutableCopy(nullptr, 0, dict);
    return SetDictionaryActive(*off, false, nullptr);
}

const std::map<std::string, Call> operations = tableOf(
    OPERATION(CopyEntityPath), OPERATION(CopyResolvedServicePath), OPERATION(CopySeIDFromSePath),
    OPERATION(CopySetPath), OPERATION(MacAddress), OPERATION(MoreSCCopyBSDNameOfService),
    OPERATION(MoreSCCopyCurrentSet), OPERATION(MoreSCCopyEntities), OPERATION(MoreSCCopyEntitiesDict),
    OPERATION(MoreSCCopyEntitiesDictMutable), OPERATION(MoreSCCopyEntity), OPERATION(MoreSCCopyEntityMutable),
    OPERATION(MoreSCCopyServiceIDs), OPERATION(MoreSCCopyServicesDict),
    OPERATION(MoreSCCopyServicesDictMutable), OPERATION(MoreSCCopySetIDs), OPERATION(MoreSCCopySetsDict),
    OPERATION(MoreSCCopyUserVisibleNameOfService), OPERATION(MoreSCCopyUserVisibleNameOfSet),
    OPERATION(MoreSCCreateActiveDHCPServicesArray), OPERATION(MoreSCCreateCCLArray),
    OPERATION(MoreSCDHCPRelease), OPERATION(MoreSCDeleteEntity), OPERATION(MoreSCDeleteService),
    OPERATION(MoreSCDeleteSet), OPERATION(MoreSCDuplicateService), OPERATION(MoreSCDuplicateSet),
    OPERATION(MoreSCFCopyEncodedPPPPassword), OPERATION(MoreSCFindSetByUserVisibleNameAndCopyID),
    OPERATION(MoreSCIsAppleTalkActive), OPERATION(MoreSCIsEntityActive), OPERATION(MoreSCIsServiceActive),
    OPERATION(MoreSCMakeNewDialupSet), OPERATION(MoreSCNewEntity), OPERATION(MoreSCNewService),
    OPERATION(MoreSCNewSet), OPERATION(MoreSCRenameService), OPERATION(MoreSCRenameSet),
    OPERATION(MoreSCSetAppleTalkActive), OPERATION(MoreSCSetCurrentSet), OPERATION(MoreSCSetEntities),
    OPERATION(MoreSCSetEntitiesDict), OPERATION(MoreSCSetEntity), OPERATION(MoreSCSetEntityActive),
    OPERATION(MoreSCSetServiceActive), OPERATION(MoreSCSetServicesDict), OPERATION(MoreSCSetSetsDict),
    OPERATION(NewSet), OPERATION(SwitchOff));

// A port that can be listed, but not be described: it has no type.
OSStatus TakeTypeOfWirelessPort(io_object_t, CFMutableDictionaryRef port, CFStringRef proposed,
                                CFStringRef* base) {
    if (CFEqual(CFDictionaryGetValue(port, CFSTR("DeviceName")), CFSTR("wlan0"))) {
        CFDictionaryRemoveValue(port, CFSTR("Type"));
    }
    *base = CFStringCreateCopy(nullptr, proposed);
    return 0;
}

class Calls : public MoreSCFTest, public testing::WithParamInterface<const char*> {
  protected:
    ~Calls() override { MoreSCFSetPortNameCallback(nullptr); }

    std::string play(const std::string& step) {
        const std::size_t end = step.find_first_of(" (");
        const std::string name = step.substr(0, end);
        const std::string rest = step.substr(std::min(end, step.size() - 1) + 1);
        if (end != std::string::npos && step[end] == '(') {
            return isInSession_ ? plainCall(step) : call(step);
        }
        if (uses.contains(name)) {
            return "    " + uses.at(name)(rest);
        }
        arrangements.at(name)(rest);
        return "";
    }

  private:
    // What holds for all calls to come.
    const std::map<std::string, std::function<void(const std::string&)>> arrangements = {
        {"tree", [this](const std::string& notation) { tree_ = notation; }},
        {"sysfs", [this](const std::string& line) { sysfs.make(line); }},
        {"hook", [](const std::string&) { MoreSCFSetPortNameCallback(TakeTypeOfWirelessPort); }},
        {"script", [this](const std::string& path) { (void)directory.write("scripts/" + path, ""); }},
        {"scripts",
         [this](const std::string& count) {
             for (int i = std::stoi(count); i-- > 0;) {
                 (void)directory.write("scripts/local/Modem " + std::to_string(i), "");
             }
         }},
        {"version",
         [this](const std::string& version) {
             host.systemVersion = version.empty() ? std::optional<std::int32_t>()
                                                  : std::optional(std::stoi(version, nullptr, 16));
             version_.emplace(host);
         }},
        {"file", [this](const std::string& notation) { setTree(notation); }},
        {"fail", [this](const std::string& call) { agent->failing.insert(call); }},
        {"set",
         [](const std::string& path) {
             SCPreferencesSetValue(MoreSCGetSCPreferencesRef(), CFSTR("CurrentSet"), Str(path));
         }},
    };

    // How a session is used. Between "begin" and "end" the calls are made in it, or without one, as they
    // are: shown is what came to the file and to the machine by then.
    const std::map<std::string, std::function<std::string(const std::string&)>> uses = {
        {"begin",
         [this](const std::string&) {
             setTree(tree_);
             isInSession_ = true;
             return "the file as it was";
         }},
        {"open",
         [](const std::string& how) {
             return std::to_string(MoreSCOpen(how.starts_with("locked"), how == "locked, waiting"));
         }},
        {"close",
         [this](const std::string& how) {
             OSStatus err = std::stoi(how);
             MoreSCClose(&err, how.ends_with("dirty"));
             return std::to_string(err) + outside();
         }},
        {"end",
         [this](const std::string&) {
             isInSession_ = false;
             agent->failing.clear();
             return "all" + outside();
         }},
    };

    std::string outside() {
        changes_.clear();
        compare(read(tree_).get(), read(tree()).get(), "");
        for (const std::string& each : std::exchange(agent->changes, {})) {
            changes_ += "\n    made so: " + each;
        }
        return changes_;
    }

    // Where a comma stands outside of all brackets, the next argument begins.
    static std::vector<std::string> split(const std::string& text) {
        std::vector<std::string> arguments(1);
        int depth = 0;
        for (const char each : text) {
            depth += (each == '{' || each == '(') - (each == '}' || each == ')');
            if (each == ',' && depth == 0) {
                arguments.emplace_back();
            } else if (each != ' ' || depth != 0 || !arguments.back().empty()) {
                arguments.back() += each;
            }
        }
        return arguments;
    }

    // The step is "Operation(argument, argument)".
    static std::string plainCall(const std::string& step) {
        const std::size_t open = step.find('(');
        std::string outputs;
        const OSStatus status = operations.at(step.substr(0, open))(
            split(step.substr(open + 1, step.rfind(')') - open - 1)), outputs);
        return "    " + std::to_string(status) + outputs;
    }
    std::string call(const std::string& step) {
        setTree(tree_);
        OSStatus err = MoreSCOpen(false, false);
        std::string outcome = plainCall(step);
        changes_.clear();
        compare(read(tree_).get(), SCPreferencesPathGetValue(MoreSCGetSCPreferencesRef(), CFSTR("/")), "");
        // On disk only what a marked session commits.
        SCPreferencesSetValue(MoreSCGetSCPreferencesRef(), CFSTR("Added"), kCFBooleanTrue);
        MoreSCClose(&err, false);
        const bool isMarked = tree().ends_with("; Added = #true}");
        outcome.insert(std::min(outcome.find('\n'), outcome.size()), isMarked ? ", marked" : "");
        return outcome + changes_;
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

    std::string tree_ = "{}";
    std::string changes_;
    bool isInSession_ = false;
    std::optional<platform::HostOverride> version_;
};

TEST_P(Calls, DoWhatTheirTranscriptShows) {
    testing_support::Transcript transcript(GetParam());
    transcript.playItself([this](const std::string& step) { return play(step); });
}
INSTANTIATE_TEST_SUITE_P(Of, Calls,
                         testing::Values("locations", "services", "new_services", "entities", "wrong_types",
                                         "helpers", "dialup", "tree", "scripts", "conversions", "session"));

}  // namespace
}  // namespace morescf_test
