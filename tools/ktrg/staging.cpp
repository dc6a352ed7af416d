// SPDX-License-Identifier: MIT
// staging: see its header. The lock on the file "held" goes with the process, so that a directory without it is nobody's.
#include "staging.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>

#include <fcntl.h>
#include <fmt/format.h>
#include <unistd.h>

#include "failure.h"
#include "kt_rg.h"

namespace ktrg
{

namespace
{

constexpr std::string_view prefix    = ".ktrg-";
constexpr std::string_view pattern   = ".ktrg-XXXXXX";
constexpr const char *     held_file = "/held";

} // namespace

staging::staging(const place & beside) : directory_(beside.directory + "/" + std::string(pattern))
{
    if (mkdtemp(directory_.data()) == nullptr)
        throw failure(errno == EACCES || errno == EROFS ? exit_code::not_permitted : exit_code::input_output,
                      beside.directory, std::strerror(errno), errno == EACCES ? RG_E_ACCESS : RG_E_SYSTEM_CALL);
    const int fd = open((directory_ + held_file).c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
    if (fd >= 0)
        close(fd);
    hold_.emplace(directory_ + held_file, beside.directory);
}

staging::~staging()
{
    std::error_code ignored;
    std::filesystem::remove_all(directory_, ignored);
}

place staging::place_for(const place & target) const
{
    place result     = target;
    result.directory = directory_;
    result.file      = directory_ + "/" + target.file_name;
    result.counter.reset();
    return result;
}

std::vector<std::string> leftover_stagings(const std::string & directory)
{
    std::vector<std::string> found;
    for (const std::string & name : files_in(directory))
        if (name.starts_with(prefix) && name.size() == pattern.size() && is_directory(directory + "/" + name))
            found.push_back(directory + (directory.ends_with('/') ? "" : "/") + name);
    return found;
}

void remove_staging(const std::string & path)
{
    const file_hold hold(path + held_file, path);
    std::error_code error;
    std::filesystem::remove_all(path, error);
    if (error)
        throw failure(exit_code::not_permitted, path, error.message(), RG_E_ACCESS);
}

} // namespace ktrg
