// SPDX-License-Identifier: MIT
// new_file: written under another name beside its own, synced, and renamed.
#include "new_file.h"

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include "failure.h"

namespace ktrg
{

void check_new_file(const std::string & path, const std::string & subject, bool replace)
{
    struct stat status {
    };
    if (stat(path.c_str(), &status) != 0)
        return;
    if (!S_ISREG(status.st_mode))
        throw failure(exit_code::usage, subject, fmt::format("{}: not a regular file", path));
    if (!replace)
        throw failure(exit_code::conflict, subject, fmt::format("{}: the file exists; --force replaces it", path));
}

new_file::new_file(std::string path, std::string subject, bool replace)
    : path_(std::move(path)), subject_(std::move(subject)), temporary_path_(path_ + ".XXXXXX")
{
    check_new_file(path_, subject_, replace);
    fd_ = mkstemp(temporary_path_.data());
    if (fd_ < 0)
        refuse(errno);
    const mode_t mask = umask(0);
    umask(mask);
    fchmod(fd_, 0666 & ~mask);
    sink_ = std::make_unique<output_sink>(fd_, path_);
}

new_file::~new_file()
{
    if (fd_ < 0)
        return;
    close(fd_);
    unlink(temporary_path_.c_str());
}

void new_file::finish()
{
    sink_->flush();
    if (fsync(fd_) != 0 || std::rename(temporary_path_.c_str(), path_.c_str()) != 0)
        refuse(errno);
    close(fd_);
    fd_ = -1;
}

void new_file::refuse(int error) const
{
    const exit_code exit = error == ENOENT || error == ENOTDIR ? exit_code::not_found
                           : error == EACCES || error == EROFS ? exit_code::not_permitted
                                                               : exit_code::input_output;
    throw failure(exit, subject_, fmt::format("{}: {}", path_, std::strerror(error)));
}

} // namespace ktrg
