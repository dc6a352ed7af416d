// SPDX-License-Identifier: MIT
// tree: see its header.
#include "tree.h"

#include <sys/stat.h>

#include "failure.h"

namespace ktrg
{

void check(kt_int32_t code, const place & where, std::string_view context)
{
    if (code == 0)
        return;
    if (code == RG_E_NO_SUCH_TABLE)
        throw no_such_table(where);
    throw registry_failure(code, where.name, context);
}

tree::tree(const place & where)
{
    check(rg_open_tree_1(&handle_, 0, 0), where);
}

// The library makes a directory that it doesn't find. Here a wrong name is a mistake to be told.
void tree::mount(const place & where, const std::string & at) const
{
    struct stat status {
    };
    if (stat(where.directory.c_str(), &status) != 0)
        throw no_such_table(where);
    check(rg_mount_local_tree_1(handle_, writable(at), writable(where.directory), 0), where);
}

void tree::close()
{
    if (handle_ != nullptr)
        rg_close_tree_1(std::exchange(handle_, nullptr));
}

} // namespace ktrg
