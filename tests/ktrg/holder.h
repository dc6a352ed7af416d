// SPDX-License-Identifier: MIT
// holder: another process that has a table open for writing.
#pragma once

#include <gtest/gtest.h>

#include <array>
#include <csignal>
#include <string>

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

namespace ktrg_test
{

// A process that holds a file as the library's writers do, until it is let go.
class holder
{
  public:
    explicit holder(const std::string & path)
    {
        std::array<int, 2> ready{};
        EXPECT_EQ(pipe(ready.data()), 0);
        pid_ = fork();
        if (pid_ == 0) {
            const int fd = open(path.c_str(), O_RDWR);
            if (fd < 0 || lockf(fd, F_LOCK, 0) != 0 || write(ready[1], "x", 1) != 1)
                _exit(1);
            pause();
            _exit(0);
        }
        char byte = 0;
        EXPECT_EQ(read(ready[0], &byte, 1), 1);
        close(ready[0]);
        close(ready[1]);
    }
    ~holder() { let_go(); }
    holder(const holder &)             = delete;
    holder & operator=(const holder &) = delete;
    void     let_go()
    {
        if (pid_ > 0) {
            kill(pid_, SIGKILL);
            waitpid(pid_, nullptr, 0);
            pid_ = -1;
        }
    }

  private:
    pid_t pid_ = -1;
};

} // namespace ktrg_test
