// What a test did and saw, compared whole with a file of tests/unit/golden. LA_UPDATE=1 in the environment
// has the file rewritten, to be read as a diff; the test then fails, as one that compared nothing.
#pragma once

#include <gtest/gtest.h>

#include <cstdlib>
#include <fstream>
#include <iterator>
#include <string>

namespace testing_support {

class Transcript {
  public:
    explicit Transcript(const std::string& name) : path_(LA_GOLDEN "/" + name + ".txt") {}
    ~Transcript() {
        if (std::getenv("LA_UPDATE") != nullptr) {
            std::ofstream(path_, std::ios::binary) << text_;
            ADD_FAILURE() << path_ << " is rewritten";
        } else {
            std::ifstream file(path_, std::ios::binary);
            EXPECT_EQ(std::string(std::istreambuf_iterator<char>(file), {}), text_) << path_;
        }
    }
    Transcript(const Transcript&) = delete;
    Transcript& operator=(const Transcript&) = delete;

    void add(const std::string& line) { text_ += line + "\n"; }

  private:
    std::string path_;
    std::string text_;
};

}  // namespace testing_support
