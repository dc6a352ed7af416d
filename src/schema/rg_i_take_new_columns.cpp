// SPDX-License-Identifier: MIT
// rg_i_take_new_columns: the end of every column change: the contents of the table that was built become those of the
// table that is changed.
//
// Layer: schema. Calls apply and commit with the new object, which borrows the old one's file for that, and the
// exchange of contents.
// Always holds: the room for the exchange is there before anything is written, since what is committed can't be taken
// back. The new object never owns the path that it borrows, and no descriptor is closed twice.
// Locking: the caller holds the old table's write lock. Nobody else can see the new object.
// Failure: the old table and its file are as they were.
#include "schema/rg_i_column_changes.h"

namespace
{

// Writes the new table over the old one's file. Then the new object's descriptor is that of the new file, and the old
// object's has been closed.
[[nodiscard]] kt_int32_t replace_file(const rg_i_table_t & table, rg_i_table_t & new_table)
{
    new_table.p_file_path      = table.p_file_path;
    new_table.file_path_length = table.file_path_length;
    new_table.file_fd          = table.file_fd;
    new_table.change_counter   = table.change_counter;

    kt_int32_t rc = rg_i_apply(&new_table, 1, 0);
    if (rc == 0)
        rc = rg_i_commit(&new_table);
    new_table.p_file_path = nullptr; // the path stays with its owner
    return rc;
}

[[nodiscard]] kt_int32_t complete(rg_i_table_t & table, rg_i_table_t & new_table)
{
    if (const kt_int32_t rc = rg_i_make_room_for_swap(&table, &new_table); rc != 0)
        return rc;
    if (table.p_file_path != nullptr)
        return replace_file(table, new_table);
    // Kept because callers depend on it: nothing is committed where there is no file, so that rows which were added to
    // the new table stay uncommitted, though no change list holds them any more.
    new_table.change_counter = table.change_counter + 1;
    return 0;
}

} // namespace

kt_int32_t rg_i_take_new_columns(rg_i_table_t * p_table, rg_i_table_t * p_new_table)
{
    const kt_int32_t rc = complete(*p_table, *p_new_table);
    if (rc == 0)
        // Kept because callers depend on it: the packed index, the application's data and the five disk_ figures aren't
        // exchanged. So the file is without the application's data until another commit record is written, and the next
        // apply that appends starts where the live commit record of the old file ended.
        rg_i_swap_with_room(p_table, p_new_table);
    p_new_table->file_fd = -1; // the old one's descriptor, which is in use or closed already
    rg_i_close_table(p_new_table);
    return rc;
}
