// What a test did and saw, compared whole with a file of tests/unit/golden. LA_UPDATE=1 in the environment
// has the file rewritten, to be read as a diff; the test then fails, as one that compared nothing.
//
// The file may hold the inputs as well: parts "=== name", and in them lines "input => outcome", of which a
// new one needs its input only. "\0a" in an input is the byte of that number, " | " stands between two of
// several. A line that begins with '#' says something about the next ones.
#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdlib>
#include <fstream>
#include <functional>
#include <iterator>
#include <sstream>
#include <string>
#include <string_view>
#include <vector>

namespace testing_support {

// Bytes as an input notes them, and back: what is not printable ASCII as "\7f".
inline std::string escaped(std::string_view bytes) {
    constexpr const char* digits = "0123456789abcdef";
    std::string text;
    for (const char each : bytes) {
        const auto byte = static_cast<unsigned char>(each);
        text += byte >= ' ' && byte < 0x7F ? std::string(1, each)
                                           : std::string{'\\', digits[byte / 16], digits[byte % 16]};
    }
    return text;
}
inline std::string unescaped(std::string_view text) {
    std::string bytes;
    for (std::size_t i = 0; i < text.size(); ++i) {
        const bool isEscape = text[i] == '\\';
        bytes += isEscape ? static_cast<char>(std::stoi(std::string(text.substr(i + 1, 2)), nullptr, 16))
                          : text[i];
        i += isEscape ? 2 : 0;
    }
    return bytes;
}

class Transcript {
  public:
    using Inputs = std::vector<std::string>;

    explicit Transcript(const std::string& name) : path_(LA_GOLDEN "/" + name + ".txt") {
        std::ifstream file(path_, std::ios::binary);
        expected_.assign(std::istreambuf_iterator<char>(file), {});
    }
    ~Transcript() {
        if (std::getenv("LA_UPDATE") != nullptr) {
            std::ofstream(path_, std::ios::binary) << text_;
            ADD_FAILURE() << path_ << " is rewritten";
        } else {
            EXPECT_EQ(expected_, text_) << path_;
        }
    }
    Transcript(const Transcript&) = delete;
    Transcript& operator=(const Transcript&) = delete;

    void add(const std::string& line) { text_ += line + "\n"; }
    // The part of that name anew, with the outcomes that its inputs have now.
    void replay(const std::string& part, const std::function<std::string(const Inputs&)>& outcomeOf) {
        const std::size_t begin = expected_.find("=== " + part + "\n");
        ASSERT_NE(begin, std::string::npos) << part;
        std::istringstream lines(expected_.substr(begin));
        std::string line;
        std::getline(lines, line);
        for (add(line); std::getline(lines, line) && !line.starts_with("=== ");) {
            const std::string input = line.substr(0, line.find(" => "));
            if (line.empty() || line[0] == '#') {
                add(line);
            } else if (line[0] != '\t') {
                const std::string outcome = outcomeOf(inputsIn(input));
                add(outcome.empty() ? line : input + " => " + outcome);
            }
        }
    }

    // A whole file of steps: each line behind "$ " is played, and what that returns stands behind it. A line
    // that begins with more blanks goes on with the one above. Comments and blank lines stay.
    void playItself(const std::function<std::string(const std::string&)>& play) {
        std::istringstream lines(expected_);
        Inputs steps, shown;
        for (std::string line; std::getline(lines, line);) {
            if (line.starts_with("$  ") && !steps.empty()) {
                steps.back() += line.substr(2);
                shown.back() += "\n" + line;
            } else if (line.empty() || line[0] == '#' || line[0] == '$') {
                steps.push_back(line);
                shown.push_back(line);
            }
        }
        EXPECT_FALSE(steps.empty()) << path_ << " has nothing to play";
        for (std::size_t i = 0; i < steps.size(); ++i) {
            add(shown[i]);
            const std::string outcome = steps[i].starts_with("$ ") ? play(steps[i].substr(2)) : "";
            text_ += outcome.empty() ? "" : outcome + "\n";
        }
    }

    // Of "input | input".
    static Inputs inputsIn(std::string_view line) {
        const std::size_t end = line.find(" | ");
        Inputs inputs{unescaped(line.substr(0, end))};
        if (end != std::string_view::npos) {
            std::ranges::copy(inputsIn(line.substr(end + 3)), std::back_inserter(inputs));
        }
        return inputs;
    }

  private:
    std::string path_;
    std::string expected_;
    std::string text_;
};

}  // namespace testing_support
