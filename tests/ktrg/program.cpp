// SPDX-License-Identifier: MIT
// program: see its header. Output goes through files, so that no pipe can fill up.
#include "program.h"

#include <array>
#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>

#include <csignal>
#include <fcntl.h>
#include <linux/capability.h>
#include <pty.h>
#include <sys/ioctl.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

namespace ktrg_test
{

namespace
{

std::vector<char *> pointers(std::vector<std::string> & words)
{
    std::vector<char *> result;
    for (std::string & word : words)
        result.push_back(word.data());
    result.push_back(nullptr);
    return result;
}

// In the child. Never returns.
[[noreturn]] void become(const std::string & program, const std::vector<std::string> & arguments,
                         std::vector<std::string> environment, const std::string & directory)
{
    std::vector<std::string> words = {program};
    words.insert(words.end(), arguments.begin(), arguments.end());
    if (chdir(directory.c_str()) != 0)
        _exit(126);
    // Also for root, permissions are what they say. Without the right to give this up nothing is to be given up.
    for (const unsigned long capability : {CAP_DAC_OVERRIDE, CAP_DAC_READ_SEARCH})
        prctl(PR_CAPBSET_DROP, capability, 0, 0, 0);
    execve(program.c_str(), pointers(words).data(), pointers(environment).data());
    _exit(127);
}

void redirect(int to, const std::string & path, int flags)
{
    const int fd = open(path.c_str(), flags, 0600);
    if (fd < 0 || dup2(fd, to) < 0)
        _exit(125);
    close(fd);
}

int wait_for(pid_t pid)
{
    int status = 0;
    while (waitpid(pid, &status, 0) < 0 && errno == EINTR) {
    }
    return status;
}

std::string read_all(const std::string & path)
{
    std::ifstream stream(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(stream), {}};
}

} // namespace

int code_of(int wait_status)
{
    return WIFEXITED(wait_status) ? WEXITSTATUS(wait_status) : 128 + WTERMSIG(wait_status);
}

scratch::scratch()
{
    std::string pattern = std::filesystem::temp_directory_path() / "ktrg_test_XXXXXX";
    EXPECT_NE(mkdtemp(pattern.data()), nullptr);
    path_ = pattern;
    std::filesystem::create_directory(path_ + "/.io");
}

scratch::~scratch()
{
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
}

void scratch::write(const std::string & name, const std::string & content) const
{
    std::filesystem::create_directories(std::filesystem::path(file(name)).parent_path());
    std::ofstream(file(name), std::ios::binary) << content;
}

std::string scratch::read(const std::string & name) const
{
    return read_all(file(name));
}

bool scratch::exists(const std::string & name) const
{
    return std::filesystem::exists(file(name));
}

std::vector<std::string> scratch::full_environment() const
{
    std::vector<std::string> result = {"PATH=/usr/bin:/bin", "TERM=xterm"};
    for (const char * p_name : {"ASAN_OPTIONS", "UBSAN_OPTIONS", "LD_LIBRARY_PATH"})
        if (const char * p_value = std::getenv(p_name); p_value != nullptr)
            result.push_back(std::string(p_name) + "=" + p_value);
    result.insert(result.end(), environment.begin(), environment.end());
    return result;
}

result scratch::run(const std::vector<std::string> & arguments, const std::string & input) const
{
    return run_program(KTRG_PROGRAM, arguments, input);
}

result scratch::run_program(const std::string & program, const std::vector<std::string> & arguments,
                            const std::string & input) const
{
    write(".io/in", input);
    const pid_t pid = fork();
    if (pid == 0) {
        redirect(STDIN_FILENO, file(".io/in"), O_RDONLY);
        redirect(STDOUT_FILENO, file(".io/out"), O_WRONLY | O_CREAT | O_TRUNC);
        redirect(STDERR_FILENO, file(".io/err"), O_WRONLY | O_CREAT | O_TRUNC);
        become(program, arguments, full_environment(), path_);
    }
    const int status = wait_for(pid);
    return {code_of(status), read(".io/out"), read(".io/err")};
}

result scratch::run_on_terminal(const std::vector<std::string> & arguments, unsigned short width) const
{
    int           terminal = -1;
    const winsize size     = {25, width, 0, 0};
    const pid_t   pid      = forkpty(&terminal, nullptr, nullptr, &size);
    if (pid == 0) {
        redirect(STDERR_FILENO, file(".io/err"), O_WRONLY | O_CREAT | O_TRUNC);
        become(KTRG_PROGRAM, arguments, full_environment(), path_);
    }
    result                 end;
    std::array<char, 4096> part{};
    for (;;) {
        const ssize_t got = ::read(terminal, part.data(), part.size());
        if (got <= 0)
            break; // EIO: the other side is closed
        end.out.append(part.data(), static_cast<std::size_t>(got));
    }
    end.code = code_of(wait_for(pid));
    end.err  = read(".io/err");
    close(terminal);
    return end;
}

scratch::running scratch::start(const std::vector<std::string> & arguments) const
{
    int ends[2] = {-1, -1};
    EXPECT_EQ(pipe2(ends, O_CLOEXEC), 0);
    const pid_t pid = fork();
    if (pid == 0) {
        dup2(ends[0], STDIN_FILENO);
        redirect(STDOUT_FILENO, file(".io/out"), O_WRONLY | O_CREAT | O_TRUNC);
        redirect(STDERR_FILENO, file(".io/err"), O_WRONLY | O_CREAT | O_TRUNC);
        become(KTRG_PROGRAM, arguments, full_environment(), path_);
    }
    close(ends[0]);
    return {pid, ends[1]};
}

result scratch::finish(running what) const
{
    close(what.input);
    const int status = wait_for(what.pid);
    return {code_of(status), read(".io/out"), read(".io/err")};
}

} // namespace ktrg_test
