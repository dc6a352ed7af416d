// SPDX-License-Identifier: MIT
// places: what the tests of copies and moves stand on: tables at two paths under a mount point and two in memory, and
// short forms of the four calls.
#pragma once

#include <sys/stat.h>

#include "storage/table_files.h"
#include "support/allocations.h"
#include "support/rows.h"

namespace kt_test
{

inline kt_int32_t copy_by_name(rg_opaque_handle_t tree, const std::string & from, const std::string & to,
                               kt_int32_t overwrite = 0)
{
    return rg_copy_table_by_name_1(tree, text(from), text(to), overwrite);
}

inline kt_int32_t move_by_name(rg_opaque_handle_t tree, const std::string & from, const std::string & to,
                               kt_int32_t overwrite = 0)
{
    return rg_move_table_by_name_1(tree, text(from), text(to), overwrite);
}

inline kt_int32_t copy_by_handle(rg_opaque_handle_t table, const std::string & to, kt_int32_t overwrite = 0)
{
    return rg_copy_table_by_handle_1(table, text(to), overwrite);
}

inline kt_int32_t move_by_handle(rg_opaque_handle_t table, const std::string & to, kt_int32_t overwrite = 0)
{
    return rg_move_table_by_handle_1(table, text(to), overwrite);
}

constexpr kt_int32_t explicit_writing = RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;

// What a handle shows, by key.
inline rows rows_by_id(rg_opaque_handle_t table)
{
    rows result = rows_of(table);
    std::sort(result.begin(), result.end());
    return result;
}

// A tree with "/r" mounted on a directory of its own. Tables by path: under "/r" they have files.
class places
{
  public:
    places() { tree.mount("/r", dir.path()); }

    rg_opaque_handle_t create(const std::string & path, const rows & content, kt_int32_t mode = RG_MODE_WRITE,
                              bool hashed = false)
    {
        rg_opaque_handle_t table = hashed ? create_hashed_table(tree, path, example_columns(), mode)
                                          : create_table(tree, path, example_columns(), mode);
        for (const auto & [id, val] : content)
            EXPECT_EQ(add(table, id, val), 0);
        if ((mode & RG_MODE_EXPLICIT_CONTROL) != 0) {
            EXPECT_EQ(commit(table), 0);
        }
        return table;
    }
    void create_and_close(const std::string & path, const rows & content, bool hashed = false)
    {
        EXPECT_EQ(rg_close_table_1(create(path, content, RG_MODE_WRITE, hashed)), 0);
    }
    // The rows, or nothing and *p_rc.
    rows rows_at(const std::string & path, kt_int32_t * p_rc = nullptr)
    {
        kt_int32_t         rc    = 0;
        rg_opaque_handle_t table = open_table(tree, path, RG_MODE_READ, &rc);
        if (p_rc != nullptr)
            *p_rc = rc;
        if (table == nullptr)
            return {};
        const rows result = rows_by_id(table);
        EXPECT_EQ(rg_close_table_1(table), 0);
        return result;
    }
    kt_int32_t code_at(const std::string & path)
    {
        kt_int32_t rc = 0;
        rows_at(path, &rc);
        return rc;
    }

    temp_dir  dir;
    open_tree tree;
};

} // namespace kt_test
