// SPDX-License-Identifier: MIT
// program: runs ktrg as its users do, in a directory of the test's own.
#pragma once

#include <gtest/gtest.h>

#include <cstdint>
#include <string>
#include <vector>

#include <sys/types.h>

namespace ktrg_test
{

struct result {
    int         code = -1; // the exit code; 128 and the signal if one ended it
    std::string out;
    std::string err;
};

// A working directory, removed with all that is in it, and ktrg in it.
class scratch
{
  public:
    scratch();
    ~scratch();
    scratch(const scratch &)             = delete;
    scratch & operator=(const scratch &) = delete;

    [[nodiscard]] std::string file(const std::string & name) const { return path_ + "/" + name; }
    void                      write(const std::string & name, const std::string & content) const;
    [[nodiscard]] std::string read(const std::string & name) const;
    [[nodiscard]] bool        exists(const std::string & name) const;

    // Environment for the runs to come, as in {"KTRG_ROOT=state"}.
    std::vector<std::string> environment;

    // Runs ktrg with an input and waits for its end.
    [[nodiscard]] result run(const std::vector<std::string> & arguments, const std::string & input = {}) const;
    // The same with any program.
    [[nodiscard]] result run_program(const std::string & program, const std::vector<std::string> & arguments,
                                     const std::string & input = {}) const;
    // The same on a terminal of the width: out has what came over the terminal.
    [[nodiscard]] result run_on_terminal(const std::vector<std::string> & arguments, unsigned short width) const;

    // Starts ktrg with a pipe as its input, which stays open until finish.
    struct running {
        pid_t pid   = -1;
        int   input = -1;
    };
    [[nodiscard]] running start(const std::vector<std::string> & arguments) const;
    // Closes its input and waits for its end.
    [[nodiscard]] result finish(running what) const;

  private:
    [[nodiscard]] std::vector<std::string> full_environment() const;
    std::string                            path_;
};

// The exit code, as a shell tells it.
[[nodiscard]] int code_of(int wait_status);

} // namespace ktrg_test
