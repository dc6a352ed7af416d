// SPDX-License-Identifier: MIT
// rg_i_close_table: destroys a table object.
//
// Layer: table. Called when the last handle goes, when a tree goes, and on every failing path that has made an object.
// Always holds: what is pending or applied is dropped. The file stays as the commit protocol left it.
// Locking: nobody else can reach the object any more.
#include <unistd.h>

#include <cstdlib>

#include "rg_i_table.h"
#include "table/rg_i_change_entries.h"
#include "table/rg_i_key_index.h"

kt_int32_t rg_i_close_table(rg_i_table_t * p_table)
{
    rg_i_rw_close(&p_table->lock);
    rg_i_rb_uninitialize_record_buffer_pool(&p_table->record_buffer_pool);
    rg_i_hash_table_close(p_table->p_rows_hash_table);
    rg_i_key_index_drop(p_table);
    std::free(p_table->p_rows_fixed_index);
    std::free(p_table->p_rows_packed_index);
    rg_i_free_change_entries(p_table);
    std::free(p_table->p_name);
    if (p_table->p_file_path != nullptr) {
        std::free(p_table->p_file_path);
        // Closing gives up the file lock.
        if (p_table->file_fd >= 0)
            close(p_table->file_fd);
        if (p_table->rewrite_file_fd >= 0)
            close(p_table->rewrite_file_fd);
    }
    std::free(p_table->p_persistent_table_registry_path);
    rg_i_free_application_metadata(p_table->p_application_metadata);
    std::free(p_table->p_packed_rows_array);
    std::free(p_table);
    return 0;
}
