// A desktop to open pages on: a private message bus that is both the system's and the user's, with stand-ins
// for the login manager and the user's service manager on it, and room for a program that opens URLs.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "platform/services/Opener.h"
#include "tests/unit/support/TemporaryDirectory.h"

namespace testing_support {

// A process of the test's own, ended with its scope.
class Process {
  public:
    explicit Process(pid_t id) : id_(id) {}
    ~Process();
    Process(const Process&) = delete;
    Process& operator=(const Process&) = delete;

  private:
    pid_t id_;
};

struct Session {
    std::string id = "2";  // empty: nobody sits at the computer
    std::uint32_t user = 65534;
    std::string sessionClass = "user";
    std::string state = "active";
    std::string type = "x11";
    std::string display = ":7";
};

class StandInDesktop {
  public:
    // Starts the bus; every user may talk to it and see the directory.
    StandInDesktop();
    ~StandInDesktop();

    // Serves the session until the end of the returned scope. The service manager's environment is that of
    // the user's session.
    [[nodiscard]] std::unique_ptr<Process> serve(const Session& session,
                                                 const std::vector<std::string>& environment = {});
    // The desktop with the script as its opening program, after one that is not installed.
    [[nodiscard]] platform::services::Desktop withProgram(const std::string& script);
    // The lines of a file that the program writes and then moves to record(), once it is there; none after
    // five seconds.
    [[nodiscard]] std::vector<std::string> recorded() const;
    [[nodiscard]] std::string record() const { return directory_.at("out/record"); }
    [[nodiscard]] std::string systemBus() const { return directory_.at("system_bus"); }
    [[nodiscard]] std::string runtimeRoot() const { return directory_.at("run"); }
    [[nodiscard]] const TemporaryDirectory& directory() const noexcept { return directory_; }

  private:
    TemporaryDirectory directory_;
    std::unique_ptr<Process> bus_;
};

}  // namespace testing_support
