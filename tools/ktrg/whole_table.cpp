// SPDX-License-Identifier: MIT
// whole_table: see its header.
#include "whole_table.h"

#include <cerrno>

#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include "hold.h"

namespace ktrg
{

namespace
{

// The library reserves the name of a target by an empty file, and leaves it there when the work fails.
class reserved_name
{
  public:
    explicit reserved_name(const std::string & file) : file_(file)
    {
        struct stat status {
        };
        was_there_ = stat(file.c_str(), &status) == 0;
    }
    ~reserved_name()
    {
        struct stat status {
        };
        if (!was_there_ && stat(file_.c_str(), &status) == 0 && status.st_size == 0)
            unlink(file_.c_str());
    }
    reserved_name(const reserved_name &)             = delete;
    reserved_name & operator=(const reserved_name &) = delete;

  private:
    std::string file_;
    bool        was_there_;
};

} // namespace

place find_target(const std::string & target, const std::string & file_name)
{
    const bool        is_bare = target.find('/') == std::string::npos && root_directory() != ".";
    const std::string path    = is_bare ? root_directory() + "/" + target : target;
    if (!is_directory(path))
        return find_place(target);
    return find_place(path + (path.ends_with('/') ? "" : "/") + file_name);
}

void check_directory(const place & where)
{
    if (access(where.directory.c_str(), W_OK | X_OK) != 0)
        throw failure(exit_code::not_permitted, where.name,
                      errno == EROFS ? "the file system is read-only"
                                     : fmt::format("no permission to write in {}", in_quotes(where.directory)),
                      RG_E_ACCESS);
}

bool check_target(const common_options & common, const place & target)
{
    struct stat status {
    };
    if (target.counter.has_value())
        throw failure(exit_code::usage, target.name, "a change counter goes with the source, not with the target");
    if (!is_directory(target.directory))
        throw no_such_table(target);
    const bool there = stat(target.file.c_str(), &status) == 0;
    if (there && !S_ISREG(status.st_mode))
        throw failure(exit_code::usage, target.name, "what has this name isn't a regular file");
    const bool replaces = there && status.st_size != 0;
    if (replaces && !common.force)
        throw failure(exit_code::conflict, target.name, "the table exists; --force replaces it", RG_E_TABLE_EXISTS);
    check_directory(target);
    wait_for_target(target, common.wait_seconds);
    return replaces;
}

void refuse_same_file(const place & source, const place & target)
{
    struct stat one {
    };
    struct stat other {
    };
    if (stat(source.file.c_str(), &one) == 0 && stat(target.file.c_str(), &other) == 0 && one.st_dev == other.st_dev &&
        one.st_ino == other.st_ino)
        throw failure(exit_code::usage, source.name, "source and target are the same file");
}

void copy_table(table & from, const place & to, bool overwrite)
{
    const stopwatch     time;
    const reserved_name name(to.file);
    // An unpacked table has a path of somebody else's choice, which can't be below a mount point.
    const char * p_at = from.where().registry_path.starts_with(target_mount_point) ? mount_point : target_mount_point;
    from.tree_of().mount(to, p_at);
    check(rg_copy_table_by_handle_1(from.handle(), writable(registry_path_at(p_at, to.file_name)), overwrite ? 1 : 0),
          to);
    struct stat status {
    };
    if (verbose() && stat(to.file.c_str(), &status) == 0)
        tell(fmt::format("{}: written: {} bytes, {}", to.name, status.st_size, time.text()));
}

void rename_table(const place & from, const place & to, bool overwrite)
{
    const reserved_name name(to.file);
    const tree          both(from);
    both.mount(from);
    both.mount(to, target_mount_point);
    check(rg_move_table_by_name_1(both.handle(), writable(from.registry_path),
                                  writable(registry_path_at(target_mount_point, to.file_name)), overwrite ? 1 : 0),
          to);
}

} // namespace ktrg
